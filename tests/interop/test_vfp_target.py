"""New Visual FoxPro tables (dialect 10) that `zqdb convert --to 10` writes,
read back by zqdb, python3-dbfread and python3-dbf; and records added to and
replaced in a Visual FoxPro table that python3-dbf wrote. (Tables of the other
dialects converted to dialect 10 are read in test_convert.py.)

- From CSV with the types of dialect 10: integers, currencies, doubles,
  date-times and memos, one of them long enough for many 64-byte blocks.
- python3-dbf appends to a table that zqdb made, and zqdb appends to and
  updates a table that python3-dbf made: memos that fit their old blocks stay
  there, blank ones are given up, new ones go to the end of the memo file.

Quirks of the other readers seen here: python3-dbf strips blanks at both
ends of text and reads a blank memo as "", dbfread as None; neither knows the
table's code page from a Visual FoxPro header whose language byte is 0, so
both are told cp1252.
"""

import datetime
import decimal
import os
import struct
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import (Suite, compare_rows, dbfread_fields, dbfread_rows, must, pydbf_rows, workdir,  # noqa: E402
                    write_csv, zqdb_fields, zqdb_rows, ZQDB)

import dbf  # noqa: E402

D = datetime.date
DT = datetime.datetime
Dec = decimal.Decimal
CP = ["--codepage", "1252"]

LONG = "".join("line %03d of a long memo, " % i for i in range(30)) + "end"  # 753 bytes: 12 blocks of 64
# CSV with the types of dialect 10.
VFP_SCHEMA = "ID I, NAME C(20), NOTE M, PRICE Y, WHEN T, RATE B, BORN D, OK L, AMT N(10,2)"
VFP_NAMES = ("ID", "NAME", "NOTE", "PRICE", "WHEN", "RATE", "BORN", "OK", "AMT")
VFP = [
    (1, "alpha", "hello memo", Dec("0.57"), DT(2020, 1, 2, 3, 4, 5), 1.25, D(2001, 2, 3), True, Dec("12.34")),
    (-2147483648, "beta", "", Dec("-3.2501"), None, Dec("-0.00000000025"), None, False, None),
    (2147483647, "gamma", LONG, Dec("922337203.4775"), DT(1999, 12, 31, 23, 59, 59), Dec("-123456789.125"),
     D(1970, 1, 1), True, Dec("-0.50")),
]
VFP_FIELDS = [("ID", "I", 4, 0), ("NAME", "C", 20, 0), ("NOTE", "M", 4, 0), ("PRICE", "Y", 8, 0),
              ("WHEN", "T", 8, 0), ("RATE", "B", 8, 0), ("BORN", "D", 8, 0), ("OK", "L", 1, 0),
              ("AMT", "N", 10, 2)]


def all_readers(s, label, path, names, want, fields=None):
    """zqdb, dbfread and python3-dbf all read `want` from `path`, a Visual
    FoxPro table; zqdb and dbfread agree on the fields."""
    with open(path, "rb") as f:
        s.check(label + " version byte", f.read(1) == b"\x30")
    zf, rf = zqdb_fields(path, *CP), dbfread_fields(path, "cp1252")
    s.check(label + " fields", zf == rf and (fields is None or zf == fields), "zqdb %s, dbfread %s" % (zf, rf))
    compare_rows(s, label + " zqdb", names, want, zqdb_rows(path, *CP))
    compare_rows(s, label + " dbfread", names, want, dbfread_rows(path, "cp1252"))
    compare_rows(s, label + " python3-dbf", names, want, pydbf_rows(path))


def memo_pointer(path, recno, field_offset):
    """The 4-byte block number at `field_offset` (flag byte counted) of record `recno`."""
    with open(path, "rb") as f:
        head = f.read(12)
        hdrlen, reclen = struct.unpack("<HH", head[8:12])
        f.seek(hdrlen + recno * reclen + field_offset)
        return struct.unpack("<I", f.read(4))[0]


def fpt_next_free(path):
    with open(path[:-3] + "fpt", "rb") as f:
        return struct.unpack(">I", f.read(4))[0]


s = Suite("vfp_target")

with workdir() as d:
    # From CSV with integers, currencies, doubles and date-times.
    vfp_csv = os.path.join(d, "vfp.csv")
    write_csv(vfp_csv, VFP_NAMES, VFP)
    made = os.path.join(d, "made.dbf")
    with s.case("CSV to 10"):
        must([ZQDB, "convert", vfp_csv, made, "--to", "10", "--schema", VFP_SCHEMA, *CP])
        # A blank double is 0: the table has no nulls.
        want = [r[:5] + ((0.0 if r[5] is None else r[5]),) + r[6:] for r in VFP]
        all_readers(s, "CSV to 10", made, VFP_NAMES, want, VFP_FIELDS)
        with open(made, "rb") as f:
            head = f.read(32)
        s.check("CSV to 10 header", struct.unpack("<H", head[8:10])[0] == 32 * 9 + 296 and head[28] == 0x02,
                head.hex())

    # python3-dbf adds a record with a memo to the table zqdb made; its memo
    # goes where the FPT header says, behind ours.
    with s.case("python3-dbf appends to ours"):
        t = dbf.Table(made, codepage="cp1252")
        t.open(dbf.READ_WRITE)
        t.append((7, "py", "memo by python3-dbf", Dec("2.5"), DT(2024, 5, 6, 7, 8, 9), 1.0, D(2024, 5, 6), True,
                  Dec("3.00")))
        t.close()
        rows = zqdb_rows(made, *CP)
        s.check("python3-dbf appends to ours", len(rows) == 4 and rows[3]["NOTE"] == "memo by python3-dbf"
                and rows[2]["NOTE"] == LONG and rows[3]["WHEN"] == "2024-05-06T07:08:09", str(rows[-1:]))

    # Append and update on a table that python3-dbf wrote.
    theirs = os.path.join(d, "theirs.dbf")
    with s.case("python3-dbf table"):
        t = dbf.Table(theirs, "ID I; NAME C(20); NOTE M; PRICE Y; WHEN T; RATE B; BORN D; OK L; AMT N(10,2)",
                      dbf_type="vfp", codepage="cp1252")
        theirs_rows = [
            (1, "alpha", "memo one, a bit longer", Dec("12.5"), DT(2020, 1, 2, 3, 4, 5), 1.25, D(2001, 2, 3), True,
             Dec("12.34")),
            (2, "beta", "second memo", Dec("-3.25"), None, -2.5, None, False, None),
        ]
        t.open(dbf.READ_WRITE)
        for row in theirs_rows:
            t.append(row)
        t.close()
        note_at = 1 + 4 + 20  # NOTE behind the flag, ID and NAME
        first_block = memo_pointer(theirs, 0, note_at)
        second_block = memo_pointer(theirs, 1, note_at)

        added = [(3, "gamma", "third memo", Dec("7.5"), DT(2021, 5, 6, 7, 8, 9), 3.5, D(2002, 3, 4), False,
                  Dec("1.5"))]
        write_csv(vfp_csv, VFP_NAMES, added)
        must([ZQDB, "convert", vfp_csv, theirs, "--mode", "append", *CP])
        all_readers(s, "appended", theirs, VFP_NAMES, theirs_rows + added)

        before = fpt_next_free(theirs)
        changes = [
            (1, "ALPHA", "memo one", Dec("13.5"), DT(2020, 1, 2, 3, 4, 6), 1.5, D(2001, 2, 4), False, Dec("2.5")),
            (2, "BETA", "", Dec("0"), None, 0.0, None, True, None),
            (4, "delta", "a new memo", Dec("1"), None, 0.0, None, True, None),
        ]
        write_csv(vfp_csv, VFP_NAMES, changes)
        must([ZQDB, "convert", vfp_csv, theirs, "--mode", "update", "--key", "ID", *CP])
        all_readers(s, "updated", theirs, VFP_NAMES, [changes[0], changes[1], added[0], changes[2]])
        # A shorter memo stays in its blocks, a blank one gives them up, and
        # only the new record's memo goes to the end of the file.
        blocks = [memo_pointer(theirs, r, note_at) for r in range(4)]
        s.check("memo blocks", blocks[0] == first_block and blocks[1] == 0 != second_block
                and blocks[3] == before and fpt_next_free(theirs) == before + 1,
                "blocks %s, next free %d; were %d, %d, %d"
                % (blocks, fpt_next_free(theirs), first_block, second_block, before))

s.done()
