"""Memo tables written by Perl XBase: dBASE III (0x83) and dBASE IV (0x8B)
with DBT files, FoxPro (0xF5) with an FPT file. zqdb reads the memos as
written; dbfread is the second reader, with its dBASE IV quirk corrected (it
takes the block's length word, which counts the 8-byte block header, as the
text's length and so returns 8 bytes too many)."""

import json
import os
import subprocess
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, run, workdir, zqdb_rows, ZQDB  # noqa: E402

# Writes the table named by argv[0] with the dBASE version byte argv[1]
# (without its memo bit) from JSON rows on stdin: [deleted, name, memo, amt,
# date, logical].
PERL = r'''
use strict; use XBase; use JSON::PP;
my ($name, $version) = @ARGV;
my $rows = decode_json(do { local $/; <STDIN> });
my $t = XBase->create(name => $name, version => hex($version),
    field_names => ["NAME", "NOTE", "AMT", "BORN", "OK"], field_types => ["C", "M", "N", "D", "L"],
    field_lengths => [12, 10, 9, 8, 1], field_decimals => [0, 0, 2, 0, 0]) or die XBase->errstr;
my $i = 0;
for my $r (@$rows) {
    my ($del, @v) = @$r;
    $t->set_record($i, @v) or die $t->errstr;
    $t->delete_record($i) if $del;
    $i++;
}
$t->close;
'''

ROWS = [
    [0, "alpha", "first memo\r\nsecond line  ", 1.5, "19991231", 1],
    [0, "beta", "m" * 1500, -2, "20000229", 0],
    [1, "gone", "memo of a deleted record", 0, None, None],
    [0, "  lead", None, None, None, None],
    [0, "last", "  blanks at both ends  ", 1234.56, "18991231", 1],
]
MEMOS = [r[2] for r in ROWS if not r[0]]

s = Suite("memo_xbase")


def write(path, version):
    r = subprocess.run(["perl", "-e", PERL, path, version], input=json.dumps(ROWS).encode(),
                       capture_output=True, timeout=60)
    if r.returncode != 0:
        raise AssertionError("perl: " + r.stderr.decode())


def without_version_word(db4):
    """Perl XBase leaves a dBASE IV memo header's version word (offset 18) at
    zero, and zqdb accepts only 0x0101 and 0x0102 there: the memo file is
    refused with a clear message, and the records read without it. Then the
    word is set to 0x0101."""
    rc, _, err = run([ZQDB, "cat", db4, "--format", "jsonl"])
    why = ", a dBASE IV memo file: its header's version word is 0x0000, not 0x0101 or 0x0102)"
    s.check("dBASE IV DBT without version word refused",
            rc == 1 and "Could not open memo file, or wrong version (" in err and why in err,
            "exit %d: %s" % (rc, err))
    rc, _, err = run([ZQDB, "cat", db4, "--memo", "errors"])
    blank = sum(1 for m in MEMOS if m)
    s.check("--memo errors counts the memos left blank",
            rc == 0 and ("%d memos were left blank under --memo errors" % blank) in err, "exit %d: %s" % (rc, err))
    rc, out, _ = run([ZQDB, "check", db4])
    s.check("dBASE IV DBT without version word found by check", rc == 1 and out.startswith("memo: the memo file"), out)
    s.compare_table("dBASE IV DBT ignored", db4, ["--memo", "errors"], "ascii",
                    ref_fix=lambda k, v: None if k == "NOTE" else v, expect_live=4)
    with open(db4[:-4] + ".dbt", "r+b") as f:
        f.seek(18)
        f.write(b"\x01\x01")


with workdir() as d:
    for label, version, byte in (("dBASE III DBT", "03", 0x83), ("FoxPro FPT", "F5", 0xF5),
                                 ("dBASE IV DBT", "0B", 0x8B)):
        path = os.path.join(d, "x%s.dbf" % version)
        with s.case(label):
            write(path, version)
            with open(path, "rb") as f:
                s.check(label + " version byte", f.read(1)[0] == byte)
            if byte == 0x8B:
                without_version_word(path)
            fix = (lambda k, v: v[:-8] if k == "NOTE" and v else v) if byte == 0x8B else None
            rows = s.compare_table(label, path, [], "ascii", ref_fix=fix, expect_live=4)
            s.check(label + " memo text", [r["NOTE"] for r in rows] == MEMOS, repr([r["NOTE"] for r in rows]))
            s.check_clean(label, path)
    # The memo policy "always" leaves every memo blank.
    rows = zqdb_rows(path, "--memo", "always")
    s.check("--memo always", [r["NOTE"] for r in rows] == [None] * 4, repr(rows))

s.done()
