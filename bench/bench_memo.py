#!/usr/bin/python3
"""Tables with one memo per record (dBASE III DBT and FoxPro FPT, memos of 0
to 2,000 bytes): appending them through the plain functions, then reading
them to CSV with zqdb, side by side with pgdbf and python3-dbfread.

    bench_memo.py PATH_TO_ZQDB [SIZE...]

The tables are written by plain_writer (beside zqdb) into bench/data/; the
time that takes is the append figure. dbfread reads the first 100,000
records of each table (its rate is flat; a whole million takes minutes).
CPU time, as bench.py counts it.
"""

import os
import subprocess
import sys
import time

import dbfread

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from bench import timed  # noqa: E402

HERE = os.path.dirname(os.path.abspath(__file__))
DATA = os.path.join(HERE, "data")
DBFREAD_RECORDS = 100000


def dbfread_rate(path):
    t0 = time.process_time()
    n = 0
    for _ in dbfread.DBF(path, encoding="latin-1"):
        n += 1
        if n == DBFREAD_RECORDS:
            break
    return n / max(time.process_time() - t0, 1e-6)


def main():
    zqdb = os.path.abspath(sys.argv[1])
    writer = os.path.join(os.path.dirname(zqdb), "plain_writer")
    sizes = [int(a) for a in sys.argv[2:]] or [100000, 1000000]
    os.makedirs(DATA, exist_ok=True)
    rows = []
    for kind, dialect in (("DBT", 1), ("FPT", 6)):
        for n in sizes:
            path = os.path.join(DATA, "memo_%s_%d.dbf" % (kind.lower(), n))
            for ext in (".dbf", ".dbt", ".fpt"):
                if os.path.exists(path[:-4] + ext):
                    os.remove(path[:-4] + ext)
            cpu, rss, _ = timed([writer, path, str(dialect), str(n), "--bench"], 1)
            append = n / cpu
            zq = timed([zqdb, "cat", path, "--dialect", str(dialect), "--format", "csv"], 3)
            memo_file = path[:-4] + "." + kind.lower()
            pg = timed(["pgdbf", "-m", memo_file, path], 3)
            dr = dbfread_rate(path)
            rows.append((kind, n, append, n / zq[0], n / pg[0], dr, zq[1]))
            print("%s %9d: append %.2f s; read zqdb %.2f s, pgdbf %.2f s; dbfread %.0f rec/s" %
                  (kind, n, cpu, zq[0], pg[0], dr), flush=True)
    print("\n%-4s %9s %14s %14s %14s %14s %11s %13s %11s" % (
        "memo", "records", "append rec/s", "zqdb rec/s", "pgdbf rec/s", "dbfread rec/s", "zqdb/pgdbf",
        "zqdb/dbfread", "zqdb RSS"))
    for kind, n, append, zq, pg, dr, rss in rows:
        print("%-4s %9d %14.0f %14.0f %14.0f %14.0f %10.2fx %12.1fx %8.1f MiB" % (
            kind, n, append, zq, pg, dr, zq / pg, zq / dr, rss / 1024))
    print("\ntargets on the memo read: zqdb/pgdbf >= 3x, zqdb/dbfread >= 10x.")


if __name__ == "__main__":
    main()
