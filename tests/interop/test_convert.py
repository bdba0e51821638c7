"""Tables that `zqdb convert` writes, read back by zqdb (which finds each
table's dialect by its bytes), python3-dbfread and python3-dbf:

1. A table of each dialect 0-9 converted to a new table of each other dialect
   and of Visual FoxPro (10), memos included where both sides have them.
2. Tables written in code page 1252 or 850, with text beyond ASCII in
   character and memo fields, read back by dbfread (with the encoding the
   .cpg file beside the table names) and by python3-dbf, text for text.
3. New Visual FoxPro tables from CSV with the types of dialect 10: integers,
   currencies, doubles, date-times and memos, one of them long enough for
   many 64-byte blocks. python3-dbf appends to a table that zqdb made, and
   zqdb appends to and updates a table that python3-dbf made: memos that fit
   their old blocks stay there, blank ones are given up, new ones go to the
   end of the memo file.

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
- python3-dbf strips blanks at both ends of text and reads a blank memo as
  "", dbfread as None; neither knows the table's code page from a Visual
  FoxPro header whose language byte is 0, so both are told cp1252.
"""

import datetime
import decimal
import os
import struct
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import (Suite, compare_rows, dbfread_fields, dbfread_rows, must, pydbf_rows, run, workdir,  # noqa: E402
                    write_csv, zqdb_fields, zqdb_rows, ZQDB)

import dbf  # noqa: E402
import dbfread  # noqa: E402
from dbfread.field_parser import FieldParser  # noqa: E402

D = datetime.date
DT = datetime.datetime
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


s = Suite("convert")

with workdir() as d:
    src_csv = os.path.join(d, "src.csv")
    write_csv(src_csv, NAMES, ROWS)

    # --- 1: every dialect to every other -------------------------------------
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
                must([ZQDB, "convert", src, dst, "--to", str(b), *CP])
                memo = a in HAS_MEMO and b in HAS_MEMO
                want = expected(memo)
                fields = zqdb_fields(dst, *CP)
                rate = "F" if a in HAS_FLOAT and b in HAS_FLOAT else "N"
                note = ("NOTE", "M", 4 if b == 10 else 10, 0) if memo else ("NOTE", "C", TEXT, 0)
                s.check(label + " fields", fields == [("NAME", "C", 20, 0), ("QTY", "N", 6, 0), ("AMOUNT", "N", 10, 2),
                                                      ("RATE", rate, 12, 4), ("BORN", "D", 8, 0), ("OK", "L", 1, 0),
                                                      note], str(fields))
                compare_rows(s, label + " zqdb", NAMES, want, zqdb_rows(dst, *CP))
                with open(dst, "rb") as f:
                    version = f.read(1)[0]
                if b not in (0, 3):
                    compare_rows(s, label + " dbfread", NAMES, want, dialect_rows(dst, b),
                                 skip=("NOTE",) if b in (7, 8) and memo else ())
                if b == 10:
                    s.check(label + " memo file", os.path.exists(dst[:-3] + "fpt") == memo)
                if version in (0x03, 0x83, 0xF5, 0x30):
                    compare_rows(s, label + " python3-dbf", NAMES, want, pydbf_rows(dst))

    # --- 2: code pages 1252 and 850 ------------------------------------------
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

    # --- 3: Visual FoxPro tables --------------------------------------------
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
