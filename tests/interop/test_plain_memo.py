"""Tables with memos that the plain functions create and fill (dbcreat,
dbopen, putmemo, dbput; the writer tests/tools/plain_writer.cpp, built beside
zqdb) read back with the values written: through zqdb in every dialect with
a memo file, through python3-dbfread in those whose memo kinds it reads (the
two dBASE DBT forms and FPT), and through python3-dbf in dBASE III and FoxPro.

Known quirks of the other readers, corrected before comparing:
- python3-dbfread reads a dBASE IV memo 8 bytes too long: it takes the
  block's length word, which counts the 8-byte block header, as the text's
  length.
- python3-dbf reads a dBASE III memo up to a pair of 0x1A bytes and so runs on
  past a memo that ends with one; it is compared up to the first 0x1A.
- nobody but zqdb reads Clipper's SMT memos.
"""

import json
import os
import subprocess
import sys

import dbf

from common import Suite, ZQDB, dbfread_table, workdir, zqdb_rows

WRITER = os.path.join(os.path.dirname(ZQDB), "plain_writer")

# dialect: (memo kind, dbfread reads it, python3-dbf reads it)
DIALECTS = {
    1: ("dBASE III", True, True),
    4: ("dBASE III", True, True),
    2: ("dBASE IV", True, False),
    9: ("dBASE IV", True, False),
    6: ("FoxPro", True, True),
    7: ("dBASE III in a 0x8B table", False, False),
    8: ("Clipper SMT", False, False),
}
RECORDS = 24


def as_text(v):
    return "" if v is None else v


def main():
    s = Suite("plain_memo")
    with workdir() as d:
        for dialect, (kind, by_dbfread, by_pydbf) in DIALECTS.items():
            label = "dialect %d (%s)" % (dialect, kind)
            table = os.path.join(d, "t%d.dbf" % dialect)
            p = subprocess.run([WRITER, table, str(dialect), str(RECORDS)], capture_output=True, timeout=60)
            if not s.check(label + " written", p.returncode == 0, p.stderr.decode()):
                continue
            expected = [json.loads(line) for line in p.stdout.decode().splitlines()]
            with s.case(label + " zqdb"):
                rows = zqdb_rows(table, "--dialect", str(dialect))
                s.check(label + " zqdb", rows == expected,
                        "first difference at %s" % next((i for i, (a, b) in enumerate(zip(rows, expected)) if a != b), "count"))
            if by_dbfread:
                with s.case(label + " dbfread"):
                    got = [as_text(r["NOTE"]) for r in dbfread_table(table, "latin-1")]
                    if kind == "dBASE IV":
                        got = [t[:-8] if t else t for t in got]
                    want = [as_text(e["NOTE"]) for e in expected]
                    s.check(label + " dbfread memos", got == want,
                            "first difference at record %s" % next((i for i, (a, b) in enumerate(zip(got, want)) if a != b), "count"))
                    names = [r["NAME"] for r in dbfread_table(table, "latin-1")]
                    s.check(label + " dbfread names", names == [e["NAME"] for e in expected])
            if by_pydbf:
                with s.case(label + " python3-dbf"):
                    t = dbf.Table(table)
                    t.open()
                    try:
                        got = [r.note for r in t]
                    finally:
                        t.close()
                    if kind == "dBASE III":
                        got = [g.split("\x1a")[0] for g in got]
                    want = [as_text(e["NOTE"]) for e in expected]
                    s.check(label + " python3-dbf memos", got == want,
                            "first difference at record %s" % next((i for i, (a, b) in enumerate(zip(got, want)) if a != b), "count"))
    s.done()


if __name__ == "__main__":
    main()
