#!/usr/bin/python3
"""Times `zqdb convert` on large inputs, side by side with ogr2ogr and
python3-dbf, and prints records per second, the ratios and zqdb's peak
memory:

    bench_convert.py PATH_TO_ZQDB [ROWS]

1. CSV -> DBF of ROWS rows (1,000,000 by default): plain rows, and the same
   rows with one memo column. ogr2ogr writes the DBF of a shapefile from the
   CSV file (`ogr2ogr -f "ESRI Shapefile" out.dbf in.csv`); python3-dbf
   appends the rows one by one from a small script. python3-dbf is timed on a
   tenth of the rows and scaled up, which the output says.
2. DBF -> DBF of the 1,000,000-record table that bench.py reads.

CPU time (user + system) of the fastest of a few runs counts, as in bench.py;
the wall time is shown beside it. Inputs are generated into bench/data/ on
first use; outputs go to a scratch directory there and are removed.
"""

import os
import random
import shutil
import subprocess
import sys
import tempfile

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, HERE)
from bench import DATA, table, timed  # noqa: E402

PYDBF_SHARE = 10  # python3-dbf writes 1/10 of the rows; its time is scaled by 10
PYDBF_LOOP = ("import csv, dbf, sys\n"
              "src, dst, fields = sys.argv[1:4]\n"
              "t = dbf.Table(dst, fields, dbf_type='db3', codepage='cp1252')\n"
              "t.open(dbf.READ_WRITE)\n"
              "with open(src, newline='', encoding='utf-8') as f:\n"
              "    r = csv.reader(f)\n"
              "    next(r)\n"
              "    for row in r:\n"
              "        row[2], row[3] = int(row[2]), float(row[3])\n"
              "        t.append(tuple(row))\n"
              "t.close()\n")
PLAIN_SPEC = "NAME C(24); CITY C(16); QTY N(7,0); AMOUNT N(11,2); BORN C(10); OK C(5)"
MEMO_SPEC = PLAIN_SPEC + "; NOTE M"

WORDS = ("alpha bravo charlie delta echo foxtrot golf hotel india juliet kilo lima mike november oscar papa "
         "quebec romeo sierra tango uniform victor whiskey xray yankee zulu").split()


def csv_file(n, memo):
    """A CSV file of n rows: two text columns, an integer, an amount with two
    decimals, an ISO date, a logical, and with `memo` a note of 260 to 400
    bytes (longer than any text field, so it becomes a memo)."""
    path = os.path.join(DATA, "conv_%s_%d.csv" % ("memo" if memo else "plain", n))
    if os.path.exists(path):
        return path
    os.makedirs(DATA, exist_ok=True)
    print("generating %s ..." % os.path.relpath(path), flush=True)
    rng = random.Random(n * 2 + memo)
    with open(path + ".tmp", "w", encoding="utf-8", newline="") as f:
        f.write("NAME,CITY,QTY,AMOUNT,BORN,OK" + (",NOTE" if memo else "") + "\r\n")
        for i in range(n):
            row = "%s %s %d,%s,%d,%d.%02d,%04d-%02d-%02d,%s" % (
                rng.choice(WORDS), rng.choice(WORDS), i, rng.choice(WORDS).upper(), rng.randrange(-99999, 999999),
                rng.randrange(0, 99999999), rng.randrange(100), rng.randrange(1900, 2030), rng.randrange(1, 13),
                rng.randrange(1, 29), "true" if rng.random() < 0.5 else "false")
            if memo:
                row += "," + " ".join(rng.choice(WORDS) for _ in range(rng.randrange(45, 65)))[:400].ljust(260, ".")
            f.write(row + "\r\n")
    os.replace(path + ".tmp", path)
    return path


def head_csv(path, rows, out):
    with open(path, encoding="utf-8", newline="") as f, open(out, "w", encoding="utf-8", newline="") as g:
        for i, line in enumerate(f):
            if i > rows:
                break
            g.write(line)
    return out


def rate(n, t):
    return n / t[0]


def main():
    zqdb = os.path.abspath(sys.argv[1])
    n = int(sys.argv[2]) if len(sys.argv) > 2 else 1_000_000
    scratch = tempfile.mkdtemp(prefix="conv_out_", dir=DATA)
    results = []
    try:
        for memo in (False, True):
            label = "CSV -> DBF" + (" with a memo" if memo else "")
            src = csv_file(n, memo)
            out = os.path.join(scratch, "zq.dbf")
            zq = timed([zqdb, "convert", src, out, "--codepage", "1252", "--no-progress"], 3)
            ogr_out = os.path.join(scratch, "ogr.dbf")
            ogr = timed(["ogr2ogr", "-overwrite", "-f", "ESRI Shapefile", ogr_out, src], 2)
            part = head_csv(src, n // PYDBF_SHARE, os.path.join(scratch, "part.csv"))
            py = timed(["/usr/bin/python3", "-c", PYDBF_LOOP, part, os.path.join(scratch, "py.dbf"),
                        MEMO_SPEC if memo else PLAIN_SPEC], 1)
            py = (py[0] * PYDBF_SHARE, py[1], py[2] * PYDBF_SHARE)
            results.append((label, n, zq, ogr, py))
            print("%-24s %d rows, CPU (wall) seconds: zqdb %.2f (%.2f), ogr2ogr %.2f (%.2f), "
                  "python3-dbf %.1f (%.1f) scaled from %d rows" % (
                      label, n, zq[0], zq[2], ogr[0], ogr[2], py[0], py[2], n // PYDBF_SHARE), flush=True)
            for f in os.listdir(scratch):
                os.remove(os.path.join(scratch, f))

        src = table(1_000_000)
        out = os.path.join(scratch, "copy.dbf")
        zq = timed([zqdb, "convert", src, out, "--codepage", "1252", "--no-progress"], 3)
        ogr = timed(["ogr2ogr", "-overwrite", "-f", "ESRI Shapefile", os.path.join(scratch, "ogr.dbf"), src], 2)
        results.append(("DBF -> DBF", 1_000_000, zq, ogr, None))
        print("%-24s %d records, CPU (wall) seconds: zqdb %.2f (%.2f), ogr2ogr %.2f (%.2f)" % (
            "DBF -> DBF", 1_000_000, zq[0], zq[2], ogr[0], ogr[2]), flush=True)
    finally:
        shutil.rmtree(scratch, ignore_errors=True)

    print()
    print("%-24s %12s %12s %14s %11s %14s %13s" % (
        "job", "zqdb rec/s", "ogr2ogr rec/s", "pydbf rec/s", "zqdb/ogr", "zqdb/pydbf", "zqdb max RSS"))
    for label, count, zq, ogr, py in results:
        print("%-24s %12.0f %12.0f %14s %10.1fx %14s %9.1f MiB" % (
            label, rate(count, zq), rate(count, ogr), "%.0f" % rate(count, py) if py else "-",
            rate(count, zq) / rate(count, ogr), "%.0fx" % (rate(count, zq) / rate(count, py)) if py else "-",
            zq[1] / 1024))
    print("\ntarget: zqdb/ogr2ogr >= 10x on plain CSV rows; zqdb's RSS should not grow with the input.")


if __name__ == "__main__":
    main()
