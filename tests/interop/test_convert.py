"""Tables that `zqdb convert` writes, read back by zqdb, python3-dbfread and
python3-dbf: a table of each dialect 0-9 converted to a new table of each
other dialect and of Visual FoxPro (10), memos included where both sides have
them; and tables written in code page 1252 or 850, with text beyond ASCII in
character and memo fields, read back by dbfread (with the encoding the .cpg
file beside the table names) and by python3-dbf, text for text.

What the other readers can't do, seen here:
- Neither reads the narrow dBASE II / Enable header (dialects 0 and 3).
- dbfread reads a dBASE IV memo 8 bytes too long (it takes the block's
  length word, which counts the 8-byte block header, as the text's length).
- dbfread reads a 0x8B table's memo file as dBASE IV; Enable OA (dialect 7)
  keeps a dBASE III memo file beside its 0x8B table, so its memos are
  compared by zqdb alone. Nobody but zqdb reads SMT (Clipper) memos.
- python3-dbf reads only 0x03, 0x83 and 0xF5 tables; it ends a dBASE III
  memo at two 0x1A bytes, where one ends it, and it takes only blanks for "no
  memo", failing on the ten digits 0 of an empty memo pointer.
"""

import datetime
import decimal
import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import (Suite, compare_rows, dbfread_rows, must, pydbf_rows, run, workdir, write_csv,  # noqa: E402
                    zqdb_fields, zqdb_rows, ZQDB)

import dbf  # noqa: E402
import dbfread  # noqa: E402
from dbfread.field_parser import FieldParser  # noqa: E402

D = datetime.date
Dec = decimal.Decimal

HAS_MEMO = {1, 2, 4, 5, 6, 7, 8, 9, 10}
HAS_FLOAT = {2, 6, 7, 9, 10}
DB4_MEMO = {2, 5, 9}  # new memo files of these dialects are dBASE IV's
TEXT = 255  # memos folded into text keep this much

LONG = "".join("line %03d of a long memo, " % i for i in range(30)) + "end"  # 753 bytes, several blocks
ROWS = [
    # NAME, QTY, AMOUNT, RATE, BORN, OK, NOTE
    ("Ann Lee", 42, Dec("1234.50"), Dec("0.1250"), D(1970, 1, 1), True, "first line\r\nsecond line"),
    ("Bob", -7, Dec("-0.75"), Dec("-12.5000"), D(2000, 2, 29), False, LONG),
    ("Çé, \"q\"", 0, Dec("0.00"), Dec("0.0000"), None, False, ""),
    ("Zoë", 999999, Dec("9999999.99"), Dec("1234567.1234"), D(1900, 12, 31), True, "ß" * 300),
]
SCHEMA = "NAME C(20), QTY N(6), AMOUNT N(10,2), RATE F(12,4), BORN D, OK L, NOTE M"
CP = ["--codepage", "1252"]


NAMES = ("NAME", "QTY", "AMOUNT", "RATE", "BORN", "OK", "NOTE")


def expected(memo_kept):
    """Values as a table keeps them: a memo folded into text is cut to 255
    bytes of code page 1252, one byte a character here. Memo text is in the
    table's code page like the other text, for every reader."""
    return [r[:6] + (r[6] if memo_kept else r[6][:TEXT].rstrip(" "),) for r in ROWS]


class NoMemo(FieldParser):
    """dbfread without memo files, for tables whose memos it can't read."""

    def parseM(self, field, data):
        return None


def dialect_rows(path, dialect):
    parser = NoMemo if dialect in (7, 8) else FieldParser
    table = dbfread.DBF(path, encoding="cp1252", parserclass=parser, ignore_missing_memofile=True)
    memo = [f.name for f in table.fields if f.type == "M"]
    rows = [dict(r) for r in table]
    for r in rows:
        for name in memo:
            if dialect in DB4_MEMO and r[name]:
                r[name] = r[name][:-8]
    return rows


s = Suite("convert")

with workdir() as d:
    src_csv = os.path.join(d, "src.csv")
    write_csv(src_csv, NAMES, ROWS)

    # A table of each dialect from the CSV file.
    for dialect in range(10):
        must([ZQDB, "convert", src_csv, os.path.join(d, "s%d.dbf" % dialect), "--to", str(dialect),
              "--schema", SCHEMA, *CP])

    for a in range(10):
        for b in range(11):
            if a == b:
                continue
            label = "%d->%d" % (a, b)
            src = os.path.join(d, "s%d.dbf" % a)
            dst = os.path.join(d, "t%d_%d.dbf" % (a, b))
            with s.case(label):
                must([ZQDB, "convert", src, dst, "--dialect", str(a), "--to", str(b), *CP])
                memo = a in HAS_MEMO and b in HAS_MEMO
                want = expected(memo)
                fields = zqdb_fields(dst, "--dialect", str(b), *CP)
                rate = "F" if a in HAS_FLOAT and b in HAS_FLOAT else "N"
                note = ("NOTE", "M", 4 if b == 10 else 10, 0) if memo else ("NOTE", "C", TEXT, 0)
                s.check(label + " fields", fields == [("NAME", "C", 20, 0), ("QTY", "N", 6, 0), ("AMOUNT", "N", 10, 2),
                                                      ("RATE", rate, 12, 4), ("BORN", "D", 8, 0), ("OK", "L", 1, 0),
                                                      note], str(fields))
                compare_rows(s, label + " zqdb", NAMES, want, zqdb_rows(dst, "--dialect", str(b), *CP))
                with open(dst, "rb") as f:
                    version = f.read(1)[0]
                if b not in (0, 3):
                    compare_rows(s, label + " dbfread", NAMES, want, dialect_rows(dst, b),
                                 skip=("NOTE",) if b in (7, 8) and memo else ())
                if b == 10:
                    s.check(label + " memo file", os.path.exists(dst[:-3] + "fpt") == memo)
                if version in (0x03, 0x83, 0xF5, 0x30):
                    compare_rows(s, label + " python3-dbf", NAMES, want, pydbf_rows(dst))

    # Characters each code page holds: 1252 has the euro sign, 850 box drawing.
    # dBASE III, dBASE IV, FoxPro, Visual FoxPro; python3-dbf refuses dBASE IV
    # tables with a memo (0x8B), and dbfread reads a dBASE IV memo 8 bytes too
    # long: its text is compared as a prefix there. python3-dbf reads a dBASE
    # III memo on to a pair of end marks where one ends it: its text is taken
    # up to the first.
    for cp, words in {"1252": ["Zoë Ærø", "Straße €5", "naïve façade"],
                      "850": ["Zoë Ærø", "Straße ½", "naïve ╬ façade"]}.items():
        src = os.path.join(d, "in_%s.csv" % cp)
        want = [(w, "%s, %s" % (w, w * 30)) for w in words]
        write_csv(src, ("NAME", "NOTE"), want)
        for dialect, pydbf_type in (("4", "db3"), ("2", None), ("6", "fp"), ("10", "vfp")):
            label = "cp%s dialect %s" % (cp, dialect)
            path = os.path.join(d, "t_%s_%s.dbf" % (cp, dialect))
            with s.case(label + " convert"):
                rc, _, err = run([ZQDB, "convert", src, path, "--to", dialect, "--codepage", cp,
                                  "--schema", "NAME C(20), NOTE M"])
                s.check(label + " convert", rc == 0 and err == "", err.strip())
                with open(path[:-4] + ".cpg") as f:
                    encoding = "cp" + f.read().strip()
            with s.case(label + " dbfread"):
                got = [(r["NAME"], r["NOTE"]) for r in dbfread_rows(path, encoding)]
                if dialect == "2":
                    got = [(n, m[:len(w[1])]) for (n, m), w in zip(got, want)]
                s.check(label + " dbfread", got == want, repr(got[:1]))
            if pydbf_type is None:
                continue
            with s.case(label + " python3-dbf"):
                t = dbf.Table(path, codepage="cp" + cp)
                t.open(dbf.READ_ONLY)
                got = [(r.name.strip(), r.note.split("\x1a")[0].strip()) for r in t]
                t.close()
                s.check(label + " python3-dbf", got == want, repr(got[:1]))

s.done()
