#!/usr/bin/python3
"""Building an index while converting:

    bench_index.py PATH_TO_ZQDB [ROWS]     (1,000,000 by default)

`zqdb convert` of ROWS CSV rows into a dBASE IV table with one MDX tag over
a 30-byte character field, and into a FoxPro table with one CDX tag over the
same field, keys in random order, side by side with
- the same converts without an index,
- `LC_ALL=C sort` of the same keys, one a line: the floor, what putting
  them in order costs at the least,
- Perl XBase building an IDX file over the table that zqdb wrote
  (`XBase::idx->create`, the one index builder Perl XBase has for dBASE
  and FoxPro formats; it reads the records, sorts the keys in memory and
  writes the pages).

Prints CPU seconds (user + system) of the fastest of a few runs, as bench.py
counts them, with the wall time beside; the time the index adds to the
convert and its ratio to sort; Perl's time over zqdb's whole convert; and
zqdb's peak memory with each index at a quarter of the rows, at all of them
and at twice as many: it grows until the page cache (32 MiB) is full and not
beyond. The CSV files are generated into bench/data/ on first use; outputs
go to a scratch directory there.
"""

import os
import random
import shutil
import subprocess
import sys
import tempfile

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, HERE)
from bench import DATA, timed  # noqa: E402

WIDTH = 30
SCHEMA = "ID N(8), K C(%d)" % WIDTH
ALPHABET = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789"
PERL_IDX = ('use XBase; use XBase::Index;\n'
            'my $t = XBase->new($ARGV[0]) or die XBase->errstr;\n'
            'XBase::idx->create($t, $ARGV[1], "K");\n')


def inputs(n):
    """(CSV file, keys file) of n rows: ID and a key of 30 random letters and
    digits; the keys file holds the same keys, one a line."""
    csv, keys = (os.path.join(DATA, "index_%d.%s" % (n, ext)) for ext in ("csv", "keys"))
    if not (os.path.exists(csv) and os.path.exists(keys)):
        os.makedirs(DATA, exist_ok=True)
        print("generating %s ..." % os.path.relpath(csv), flush=True)
        rng = random.Random(n)
        with open(csv + ".tmp", "w", newline="") as c, open(keys + ".tmp", "w", newline="") as k:
            c.write("ID,K\r\n")
            for i in range(1, n + 1):
                key = "".join(rng.choices(ALPHABET, k=WIDTH))
                c.write("%d,%s\r\n" % (i, key))
                k.write(key + "\n")
        os.replace(keys + ".tmp", keys)
        os.replace(csv + ".tmp", csv)
    return csv, keys


# (label, the file the tag goes in, convert options of the target)
TARGETS = [("dBASE IV", "MDX", []), ("FoxPro", "CDX", ["--to", "foxpro"])]


def convert(zqdb, csv, out, index, opts):
    return [zqdb, "convert", csv, out, "--schema", SCHEMA, "--no-progress", *opts] + (["--index", "K=K"] if index else [])


def key_count(zqdb, table):
    p = subprocess.run([zqdb, "keys", table, "--index", "K"], capture_output=True, check=True)
    return p.stdout.count(b"\n") - 1  # the header line


def main():
    zqdb = os.path.abspath(sys.argv[1])
    n = int(sys.argv[2]) if len(sys.argv) > 2 else 1_000_000
    csv, keys = inputs(n)
    more = [n // 4, 2 * n]  # rows of the runs that show the memory
    scratch = tempfile.mkdtemp(prefix="index_out_", dir=DATA)
    runs = []  # (label, file kind, with the index, without, [(rows, with the index)])
    try:
        out = os.path.join(scratch, "t.dbf")
        for label, kind, opts in TARGETS:
            with_ix = timed(convert(zqdb, csv, out, True, opts), 3)
            count = key_count(zqdb, out)
            if count != n:
                raise SystemExit("the %s tag holds %d keys of %d rows" % (kind, count, n))
            plain = timed(convert(zqdb, csv, out, False, opts), 3)
            memory = [(m, timed(convert(zqdb, inputs(m)[0], os.path.join(scratch, "m.dbf"), True, opts), 1))
                      for m in more]
            runs.append((label, kind, with_ix, plain, memory))
        srt = timed(["env", "LC_ALL=C", "sort", keys], 3)
        perl = timed(["perl", "-e", PERL_IDX, out, os.path.join(scratch, "t.idx")], 1)
    finally:
        shutil.rmtree(scratch, ignore_errors=True)

    print("\n%d rows, one tag over C(%d), keys in random order" % (n, WIDTH))
    print("%-44s %10s %10s %12s" % ("job", "CPU s", "wall s", "max RSS"))
    rows = []
    for label, kind, with_ix, plain, memory in runs:
        rows += [("zqdb convert to %s with one %s tag" % (label, kind), with_ix),
                 ("zqdb convert to %s without an index" % label, plain)]
        rows += [("zqdb convert with the %s tag, %d rows" % (kind, m), t) for m, t in memory]
    rows += [("LC_ALL=C sort of the keys", srt), ("Perl XBase::idx->create", perl)]
    for label, t in rows:
        print("%-44s %10.2f %10.2f %8.1f MiB" % (label, t[0], t[2], t[1] / 1024))
    for label, kind, with_ix, plain, memory in runs:
        added = with_ix[0] - plain[0]
        print()
        print("%s: the %s tag adds %.2f s CPU: %.1fx sort's %.2f s" % (label, kind, added, added / srt[0], srt[0]))
        print("%s: Perl XBase takes %.1fx zqdb's whole convert with the tag" % (label, perl[0] / with_ix[0]))
        peaks = sorted([(n, with_ix)] + memory)
        print("%s: zqdb's peak memory with the tag: " % label
              + ", ".join("%.1f MiB at %d rows" % (t[1] / 1024, m) for m, t in peaks))
    print("\ntargets: the index adds at most 10x sort; Perl XBase takes at least 3x the whole convert;"
          " zqdb's memory flat in the table size.")


if __name__ == "__main__":
    main()
