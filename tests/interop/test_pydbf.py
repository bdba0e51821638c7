"""Tables written by python3-dbf (dBASE III, FoxPro, Visual FoxPro), with
deleted records and text in a code page, read alike by zqdb and dbfread."""

import datetime
import decimal
import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, run, workdir, zqdb_rows, ZQDB  # noqa: E402

import dbf  # noqa: E402

D = datetime.date
T = datetime.datetime


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
    rows = s.compare_table("dBASE III cp850", db3, ["--codepage", "850"], "cp850", expect_live=5)
    if rows:
        s.check("dBASE III leading blanks stripped by the writer", rows[1]["NAME"] == "Ørsted", repr(rows[1]["NAME"]))
        rc, out, _ = run([ZQDB, "cat", db3, "--format", "jsonl", "--codepage", "850"])
        s.check("N keeps the table's digits", '"PRICE":12.50' in out and '"PRICE":-0.75' in out, out.splitlines()[0])
    s.check_clean("dBASE III", db3)

    # Without --codepage the language driver byte python3-dbf writes (0x02)
    # names code page 850; --codepage 0 passes the bytes unconverted.
    with s.case("code page by the language driver"):
        auto = zqdb_rows(db3)
        s.check("code page 850 found without --codepage", auto[0]["NAME"] == "Müller", repr(auto[0]["NAME"]))
        raw = zqdb_rows(db3, "--codepage", "0")
        s.check("bytes pass through with --codepage 0", raw[0]["NAME"] != "Müller", repr(raw[0]["NAME"]))

    # FoxPro: python3-dbf writes FoxPro tables only with a memo field (0xF5),
    # which the default dialect reads as FoxPro. The memo text itself is
    # compared in test_memo_pydbf.py; here the memo file is left aside.
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
    s.compare_table("FoxPro by dialect name", fp, ["--codepage=1252", "--memo=always", "--dialect", "foxpro"],
                    "cp1252", ref_fix=no_memo, expect_live=3)
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
    with open(vfp, "rb") as f:
        s.check("Visual FoxPro version byte", f.read(1) == b"\x30")
    # A B field marks the table as one with a memo file even when its values
    # lie in the record; python3-dbf writes no .fpt for it, so memo errors
    # are ignored here.
    rows = s.compare_table("Visual FoxPro", vfp, ["--dialect", "10", "--codepage", "1252", "--memo", "errors"],
                           "cp1252", expect_live=3)
    if rows:
        s.check("Y is scaled by 10000", rows[0]["PRICE"] == decimal.Decimal("12.3456"), repr(rows[0]["PRICE"]))
        s.check("I is signed", rows[2]["COUNT"] == -2147483647, repr(rows[2]["COUNT"]))
    s.check_clean("Visual FoxPro", vfp, "--dialect", "10")
    # Read as dBASE IV, a Visual FoxPro table is refused.
    rc, _, err = run([ZQDB, "cat", vfp, "--dialect", "2", "--format", "jsonl", "--memo", "errors"])
    s.check("0x30 refused outside dialect 10", rc == 1 and "Error opening data file" in err, "exit %d %s" % (rc, err))

    # A table with no records.
    empty = os.path.join(d, "empty.dbf")
    write(empty, "A C(5); B N(3,0)", "db3", "cp1252", [])
    s.compare_table("empty dBASE III", empty, [], "cp1252", expect_live=0)
    s.check_clean("empty dBASE III", empty)

# A Clipper table of python3-dbf with a C field of 5,000 bytes, its length's
# high byte in the decimals byte: read whole, and the field behind it from the
# right offset, as dbfread reads it.
with workdir() as d:
    long_c = os.path.join(d, "long.dbf")
    with s.case("C(5000) write"):
        t = dbf.Table(long_c, "NAME C(5000); QTY N(3,0)", dbf_type="clp")
        t.open(dbf.READ_WRITE)
        t.append(("x" * 4999 + "y", 7))
        t.append(("short", 8))
        t.close()
    rows = s.compare_table("C(5000)", long_c, [], "ascii", expect_live=2)
    if rows:
        s.check("C(5000) whole", rows[0]["NAME"] == "x" * 4999 + "y" and rows[0]["QTY"] == 7, repr(rows[0])[:80])
    s.check_clean("C(5000)", long_c)

s.done()
