#!/usr/bin/python3
"""check and reindex of a table with a memo file and one index, side by side
with a plain read of the same table:

    bench_check.py PATH_TO_ZQDB [ROWS]     (1,000,000 by default)

The tables are bench_memo.py's generated memo tables (one memo of 0 to 2,000
bytes per record), converted once by zqdb into a dBASE IV table with a DBT
file and an MDX tag, and a FoxPro table with an FPT file and a CDX tag, each
tag over the 30-byte NAME field; they are kept in bench/data/. For each:
`zqdb cat` to CSV (which reads every memo), `zqdb check` (table, memo
pointers and lengths, the tag's tree and one key per record) and `zqdb
reindex` (the tag built anew and moved into place), timed as bench.py times
them: CPU seconds (user + system) of the fastest run, the wall time beside
it, and their ratios to cat.
"""

import os
import subprocess
import sys

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, HERE)
import bench_memo  # noqa: E402
from bench import DATA, timed  # noqa: E402

# (label, memo kind of the generated table, its dialect, target dialect, index file)
KINDS = [("dBASE IV, DBT, MDX", "dbt", 1, "dBASE IV", ".mdx"), ("FoxPro, FPT, CDX", "fpt", 6, "foxpro", ".cdx")]


def indexed(zqdb, kind, dialect, to, ext, n):
    """The generated memo table of `kind` converted to `to` with a tag over NAME."""
    src, _ = bench_memo.table(kind, n)
    out = os.path.join(DATA, "check_%s_%d.dbf" % (kind, n))
    if not os.path.exists(out[:-4] + ext) or os.path.getmtime(out[:-4] + ext) < os.path.getmtime(src):
        print("converting %s ..." % os.path.relpath(out), flush=True)
        subprocess.run([zqdb, "convert", src, out, "--dialect", str(dialect), "--to", to, "--index", "NAME=NAME",
                        "--no-progress", "--quiet"], check=True)
    return out


def main():
    zqdb = os.path.abspath(sys.argv[1])
    n = int(sys.argv[2]) if len(sys.argv) > 2 else 1_000_000
    rows = []
    for label, kind, dialect, to, ext in KINDS:
        table = indexed(zqdb, kind, dialect, to, ext, n)
        cat = timed([zqdb, "cat", table, "--format", "csv"], 3)
        check = timed([zqdb, "check", table], 3)
        reindex = timed([zqdb, "reindex", table], 3)
        rows.append((label, cat, check, reindex))
        print("%s, %d records, CPU (wall) s: cat %.2f (%.2f), check %.2f (%.2f), reindex %.2f (%.2f)" % (
            label, n, cat[0], cat[2], check[0], check[2], reindex[0], reindex[2]), flush=True)

    print("\n%-20s %12s %12s %14s %10s %12s %11s %12s" % (
        "table", "cat rec/s", "check rec/s", "reindex rec/s", "check/cat", "reindex/cat", "check RSS", "reindex RSS"))
    for label, cat, check, reindex in rows:
        print("%-20s %12.0f %12.0f %14.0f %9.1fx %11.1fx %7.1f MiB %8.1f MiB" % (
            label, n / cat[0], n / check[0], n / reindex[0], check[0] / cat[0], reindex[0] / cat[0],
            check[1] / 1024, reindex[1] / 1024))
    print("(check/cat and reindex/cat: CPU time over cat's; the wall times above include reindex's fsync)")


if __name__ == "__main__":
    main()
