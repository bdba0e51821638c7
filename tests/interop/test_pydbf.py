"""Tables written by python3-dbf (dBASE III, FoxPro, Visual FoxPro, Clipper),
with deleted records, text in a code page, blank values and memos, read
alike by zqdb and dbfread."""

import datetime
import decimal
import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, workdir  # noqa: E402

import dbf  # noqa: E402

D = datetime.date
T = datetime.datetime

# Multi-line text, blanks at both ends, memos spanning several blocks (three
# 512-byte DBT blocks, many FPT blocks), empty memos, the memo of a deleted
# record (the fourth). Memo bytes are delivered as they are (no code page),
# so the non-ASCII text here stays within Latin-1, which reads the same
# through either reader.
MEMOS = ["  first line\r\nsecond line  ", "", "x" * 700 + "\r\n" + "y" * 400, "deleted record's memo",
         "café, naïve, Ærø", None, "tab\there \"quoted\" \\ backslash"]


def write(path, specs, dbf_type, codepage, rows, deleted=()):
    """Writes `rows` with python3-dbf and marks the rows numbered in `deleted`."""
    t = dbf.Table(path, specs, dbf_type=dbf_type, codepage=codepage)
    t.open(dbf.READ_WRITE)
    for row in rows:
        t.append(row)
    for i in deleted:
        dbf.delete(t[i])
    t.close()


s = Suite("pydbf")

with workdir() as d:
    # dBASE III in code page 850. python3-dbf strips blanks at both ends as it
    # writes, so "  Ørsted " is stored as "Ørsted".
    db3 = os.path.join(d, "people.dbf")
    write(db3, "NAME C(25); QTY N(6,0); PRICE N(10,2); BORN D; ACTIVE L", "db3", "cp850", [
        ("Müller", 3, 12.5, D(1970, 1, 1), True),
        ("  Ørsted ", -42, -0.75, D(2000, 2, 29), False),
        ("Ça va, \"oui\"", 0, 0, None, None),
        ("gone", 1, 1, D(1999, 12, 31), True),
        ("", None, None, None, None),
        ("Ñandú ½", 999999, 9999999.99, D(1900, 1, 1), True),
        ("also gone", 2, 2, None, False),
    ], deleted=(3, 6))
    with open(db3, "rb") as f:
        s.check("dBASE III version byte", f.read(1) == b"\x03")
    # Without --codepage: the language driver byte python3-dbf writes (0x02)
    # names code page 850.
    rows = s.compare_table("dBASE III cp850", db3, [], "cp850", expect_live=5)
    if rows:
        s.check("dBASE III leading blanks stripped by the writer", rows[1]["NAME"] == "Ørsted", repr(rows[1]["NAME"]))
    s.check_clean("dBASE III", db3)

    # FoxPro: python3-dbf writes FoxPro tables only with a memo field (0xF5),
    # which the default dialect reads as FoxPro. The memo text itself is
    # compared below; here the memo file is left aside.
    fp = os.path.join(d, "fox.dbf")
    write(fp, "CODE C(10); RATE F(12,4); N2 N(18,6); WHEN D; OK L; NOTE M", "fp", "cp1252", [
        ("Dvoržák Œ", 1.2345, 123456789.123456, D(2024, 6, 30), True, "x"),
        ("€uro", -0.0001, -1, D(1980, 5, 17), False, None),
        ("dead", 5, 5, None, None, None),
        ("æøå", None, None, None, True, "y"),
    ], deleted=(2,))
    no_memo = lambda k, v: None if k == "NOTE" else v  # noqa: E731
    s.compare_table("FoxPro cp1252", fp, ["--codepage", "1252", "--memo", "always"], "cp1252",
                    ref_fix=no_memo, expect_live=3)
    s.check_clean("FoxPro", fp)

    # Visual FoxPro with the binary types I, Y, T and B.
    vfp = os.path.join(d, "vfp.dbf")
    write(vfp, "NAME C(20); AMT N(10,2); COUNT I; PRICE Y; STAMP T; RATIO B; BORN D; OK L", "vfp", "cp1252", [
        ("Zoë", 12.5, -7, decimal.Decimal("12.3456"), T(2020, 1, 2, 3, 4, 5), 1.25, D(1999, 12, 31), True),
        ("max", 99999.99, 2147483646, decimal.Decimal("-92233720368.4775"), T(1900, 3, 1, 23, 59, 59),
         -1e-300, D(2038, 1, 19), False),
        ("deleted", 1, 1, decimal.Decimal(1), T(2001, 1, 1), 1.0, D(2001, 1, 1), True),
        ("min", -9999.99, -2147483647, decimal.Decimal("0.0001"), T(1970, 1, 1, 0, 0, 1), 6.02e23, None, None),
    ], deleted=(2,))
    # Read as dialect 10 (which refuses any other version byte). A B field marks the table as one with a memo file even when its values
    # lie in the record; python3-dbf writes no .fpt for it, so memo errors
    # are ignored here.
    s.compare_table("Visual FoxPro", vfp, ["--dialect", "10", "--codepage", "1252", "--memo", "errors"], "cp1252",
                    expect_live=3)
    s.check_clean("Visual FoxPro", vfp, "--dialect", "10")

    # A table with no records.
    empty = os.path.join(d, "empty.dbf")
    write(empty, "A C(5); B N(3,0)", "db3", "cp1252", [])
    s.compare_table("empty dBASE III", empty, [], "cp1252", expect_live=0)
    s.check_clean("empty dBASE III", empty)

    # Blank values as python3-dbf writes them: blanks, "?" in a logical, and
    # in Visual FoxPro zero-filled binary fields (an empty date-time is eight
    # zero bytes). zqdb reads each as null, as dbfread does.
    blank3 = os.path.join(d, "blank3.dbf")
    write(blank3, "N N(5,1); D D; L L; C C(3)", "db3", None, [(None,) * 4, (1.5, None, True, "a")])
    rows = s.compare_table("dBASE III blanks", blank3, [], "ascii", expect_live=2)
    if rows:
        s.check("blank N, D, L are null", rows[0] == {"N": None, "D": None, "L": None, "C": ""}, repr(rows[0]))
    blank = os.path.join(d, "blank.dbf")
    write(blank, "N N(5,1); D D; L L; C C(3); T T; I I; Y Y; B B", "vfp", None, [(None,) * 8])
    s.compare_table("Visual FoxPro blanks", blank, ["--dialect", "10", "--memo", "errors"], "ascii", expect_live=1)

    # A Clipper table with a C field of 5,000 bytes, its length's high byte in
    # the decimals byte: read whole, and the field behind it from the right
    # offset, as dbfread reads it.
    long_c = os.path.join(d, "long.dbf")
    write(long_c, "NAME C(5000); QTY N(3,0)", "clp", None, [("x" * 4999 + "y", 7), ("short", 8)])
    s.compare_table("C(5000)", long_c, [], "ascii", expect_live=2)
    s.check_clean("C(5000)", long_c)

    # Memos: a DBT file of dBASE III, FPT files of FoxPro and Visual FoxPro.
    # (A memo file that isn't there is an error under the default --memo never.)
    for label, dbf_type, opts, version in (
            ("dBASE III DBT", "db3", [], 0x83),
            ("FoxPro FPT", "fp", [], 0xF5),
            ("Visual FoxPro FPT", "vfp", ["--dialect", "Visual FoxPro"], 0x30)):
        path = os.path.join(d, "memo_%s.dbf" % dbf_type)
        write(path, "NAME C(12); NOTE M", dbf_type, "cp1252", [("row%d" % i, m) for i, m in enumerate(MEMOS)],
              deleted=(3,))
        with open(path, "rb") as f:
            s.check(label + " version byte", f.read(1)[0] == version)
        rows = s.compare_table(label, path, opts + ["--codepage", "1252"], "cp1252", expect_live=len(MEMOS) - 1)
        if rows:
            got, want = [r["NOTE"] or None for r in rows], [m or None for i, m in enumerate(MEMOS) if i != 3]
            s.check(label + " memo text", got == want, repr([(g or "")[:30] for g in got]))
        s.check_clean(label, path, *opts)

s.done()
