"""Memo tables written by python3-dbf: dBASE III with a DBT file, FoxPro and
Visual FoxPro with an FPT file. zqdb reads the memo text as dbfread does:
multi-line text, blanks at both ends kept, memos spanning several blocks,
empty memos, and memos of deleted records left out."""

import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, workdir  # noqa: E402

import dbf  # noqa: E402

# Memo bytes are delivered as they are (no code page), so the non-ASCII text
# here stays within Latin-1, which reads the same through either reader.
MEMOS = [
    "  first line\r\nsecond line  ",
    "",
    "x" * 700 + "\r\n" + "y" * 400,          # three 512-byte DBT blocks, many FPT blocks
    "deleted record's memo",
    "café, naïve, Ærø",
    None,
    "tab\there \"quoted\" \\ backslash",
]
LIVE = 6


def write(path, dbf_type, extra_spec="", extra=()):
    t = dbf.Table(path, "NAME C(12); NOTE M" + extra_spec, dbf_type=dbf_type, codepage="cp1252")
    t.open(dbf.READ_WRITE)
    for i, memo in enumerate(MEMOS):
        t.append(("row%d" % i, memo) + tuple(extra))
    dbf.delete(t[3])
    t.close()


s = Suite("memo_pydbf")

with workdir() as d:
    for label, dbf_type, opts, memo_ext, version in (
            ("dBASE III DBT", "db3", [], ".dbt", 0x83),
            ("FoxPro FPT", "fp", [], ".fpt", 0xF5),
            ("Visual FoxPro FPT", "vfp", ["--dialect", "Visual FoxPro"], ".fpt", 0x30)):
        path = os.path.join(d, dbf_type + ".dbf")
        write(path, dbf_type)
        with open(path, "rb") as f:
            s.check(label + " version byte", f.read(1)[0] == version)
        s.check(label + " memo file", os.path.exists(path[:-4] + memo_ext))
        rows = s.compare_table(label, path, opts + ["--codepage", "1252"], "cp1252", expect_live=LIVE)
        if rows:
            want = [m for i, m in enumerate(MEMOS) if i != 3]
            got = [r["NOTE"] for r in rows]
            s.check(label + " memo text", [g or None for g in got] == [w or None for w in want],
                    repr([(g or "")[:30] for g in got]))
        s.check_clean(label, path, *opts)

s.done()
