"""Tables with memos that the plain functions create and fill (dbcreat,
dbopen, putmemo, dbput, dbclose: tests/tools/memo_table_writer.cpp) read back
with the values written, memos included, in every dialect with a memo file:

- through `zqdb cat --format jsonl`, record for record equal to what the
  writer says it wrote (the only check of Clipper's SMT memos, which no
  other program here reads);
- through python3-dbfread, every field, memos where it reads their kind (the
  two dBASE DBT forms and FPT; not SMT, and not the dBASE III memo file of an
  Enable OA table, whose version byte 0x8B makes dbfread take it for dBASE IV);
- through python3-dbf, every field, in the tables it opens (0x83 with a
  dBASE III memo file, 0xF5 with FPT).

Field descriptors are compared between zqdb info, dbfread and python3-dbf.

    plain_memo.py PATH_TO_ZQDB PATH_TO_MEMO_TABLE_WRITER

Known quirks of the other readers, corrected before comparing:
- dbfread reads a dBASE IV memo 8 bytes too long: it takes the block's
  length word, which counts the 8-byte block head, as the text's length.
- python3-dbf reads a dBASE III memo on past its single 0x1A (it looks for a
  pair or the block's end): compared up to the first 0x1A. It strips blanks
  at both ends of a memo (the writer's memos end in letters), pads character
  values, and fails with TypeError on ten zero digits, the record form of no
  memo: that is taken as no memo.
"""

import decimal
import json
import os
import subprocess
import sys

import dbf
import dbfread
from dbfread.field_parser import FieldParser

from common import Suite, dbfread_fields, same_value, workdir, zqdb_fields, zqdb_rows

WRITER = os.path.abspath(sys.argv[2]) if len(sys.argv) > 2 else "memo_table_writer"
RECORDS = 40  # every memo length of the writer several times, ten replaced memos

# dialect: (memo kind, dbfread reads the memos, python3-dbf opens the table)
DIALECTS = {
    1: ("dBASE III+, DBT", True, True),
    4: ("dBASE III, DBT", True, True),
    2: ("dBASE IV, dBASE IV DBT", True, False),
    9: ("Visual dBASE, dBASE IV DBT", True, False),
    6: ("FoxPro, FPT", True, True),
    7: ("Enable OA, dBASE III DBT under 0x8B", False, False),
    8: ("Clipper, SMT", False, False),
}


class MemoUnread(FieldParser):
    """dbfread without memo lookups, for memo kinds it can't read."""

    def parseM(self, field, data):
        return None


def first_difference(got, want):
    for i, (g, w) in enumerate(zip(got, want)):
        keys = [k for k in w if g.get(k) != w[k]] + [k for k in g if k not in w]
        if keys:
            return "record %d, fields %s: got %.120r, expected %.120r" % (
                i, keys, [g.get(k) for k in keys], [w.get(k) for k in keys])
    return "%d records, expected %d" % (len(got), len(want))


def compare_rows(s, label, letters, want, got, skip=()):
    """`got` (another reader's rows) hold the values of `want` (the writer's
    rows, in zqdb's JSON form), field by field."""
    s.check(label + " record count", len(got) == len(want), "%d, expected %d" % (len(got), len(want)))
    bad = ["record %d %s: got %r, expected %r" % (i, k, g[k], w[k])
           for i, (w, g) in enumerate(zip(want, got)) for k in w
           if k not in skip and not same_value(letters[k], w[k], g.get(k))]
    s.check(label + " values", not bad, "; ".join(bad[:5]) + (" ..." if len(bad) > 5 else ""))


def dbfread_rows(table, memo_kind, reads_memos):
    t = dbfread.DBF(table, encoding="latin-1", char_decode_errors="strict", ignore_missing_memofile=True,
                    parserclass=FieldParser if reads_memos else MemoUnread)
    rows = [dict(r) for r in t]
    if memo_kind.endswith("dBASE IV DBT"):
        for r in rows:
            r["NOTE"] = r["NOTE"][:-8] if r["NOTE"] else r["NOTE"]
    return rows


def pydbf_table(table):
    """(fields as (name, letter, width, decimals), rows) from python3-dbf,
    which gives names in lower case."""
    t = dbf.Table(table, codepage="cp1252")
    t.open()
    try:
        fields = []
        for name in t.field_names:
            info = t.field_info(name)
            fields.append((name, chr(info.field_type), info.length, info.decimal))
        rows = []
        for rec in t:
            row = {}
            for name, letter, _, _ in fields:
                try:
                    v = rec[name]
                except TypeError:  # ten zero digits: no memo
                    v = None
                if letter == "M" and v is not None:
                    v = v.split("\x1a")[0]
                elif letter == "C":
                    v = v.rstrip(" ")
                row[name.upper()] = v
            rows.append(row)
        return [(f[0].upper(),) + f[1:] for f in fields], rows
    finally:
        t.close()


def main():
    s = Suite("plain_memo")
    with workdir() as d:
        for dialect, (kind, by_dbfread, by_pydbf) in DIALECTS.items():
            label = "dialect %d (%s)" % (dialect, kind)
            table = os.path.join(d, "t%d.dbf" % dialect)
            p = subprocess.run([WRITER, table, str(dialect), str(RECORDS)], capture_output=True, timeout=60)
            if not s.check(label + " written", p.returncode == 0, p.stderr.decode()):
                continue
            want = [json.loads(line, parse_float=decimal.Decimal) for line in p.stdout.decode().splitlines()]
            opts = ("--dialect", str(dialect))
            with s.case(label + " zqdb"):
                rows = zqdb_rows(table, *opts)
                s.check(label + " zqdb rows", rows == want, first_difference(rows, want))
            with s.case(label + " dbfread"):
                fields = dbfread_fields(table, "latin-1")
                zf = zqdb_fields(table, *opts)
                s.check(label + " fields, zqdb and dbfread", zf == fields, "zqdb %s, dbfread %s" % (zf, fields))
                letters = {f[0]: f[1] for f in fields}
                compare_rows(s, label + " dbfread", letters, want, dbfread_rows(table, kind, by_dbfread),
                             skip=() if by_dbfread else ("NOTE",))
            if by_pydbf:
                with s.case(label + " python3-dbf"):
                    pf, prows = pydbf_table(table)
                    s.check(label + " fields, python3-dbf", pf == fields, "python3-dbf %s, dbfread %s" % (pf, fields))
                    compare_rows(s, label + " python3-dbf", letters, want, prows)
    s.done()


if __name__ == "__main__":
    main()
