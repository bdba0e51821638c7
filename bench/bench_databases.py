#!/usr/bin/python3
"""DBF to databases: 1,000,000 records to SQLite beside `ogr2ogr -f SQLite`,
and to a PostgreSQL script beside pgdbf, in one run:

    bench_databases.py PATH_TO_ZQDB [SIZE]

The table is bench.py's generated one. Each tool runs a few times and the
fastest run counts, in CPU time (user + system); the wall time is shown
beside it. SQLite files are written to bench/data/ and removed after.
"""

import os
import sys

from bench import table, timed

HERE = os.path.dirname(os.path.abspath(__file__))
DATA = os.path.join(HERE, "data")


def main():
    zqdb = os.path.abspath(sys.argv[1])
    n = int(sys.argv[2]) if len(sys.argv) > 2 else 1_000_000
    path = table(n)
    db_zq, db_ogr = os.path.join(DATA, "bench_zq.sqlite"), os.path.join(DATA, "bench_ogr.sqlite")

    def fresh(*paths):
        for p in paths:
            if os.path.exists(p):
                os.remove(p)

    runs = 3
    results = {}
    fresh(db_zq, db_ogr)
    results["zqdb sqlite"] = timed(["sh", "-c", 'rm -f "$1"; exec "$0" convert "$2" "$1" --codepage 1252 --no-progress',
                                    zqdb, db_zq, path], runs)
    results["ogr2ogr sqlite"] = timed(["sh", "-c", 'rm -f "$0"; exec ogr2ogr -f SQLite "$0" "$1"', db_ogr, path], runs)
    results["zqdb pgsql"] = timed([zqdb, "cat", path, "--codepage", "1252", "--format", "pgsql"], runs)
    results["pgdbf"] = timed(["pgdbf", "-s", "cp1252", path], runs)
    fresh(db_zq, db_ogr)

    print("%d records, CPU (wall) seconds:" % n)
    for k, v in results.items():
        print("  %-16s %7.2f (%6.2f)   %10.0f rec/s" % (k, v[0], v[2], n / v[0]))
    print()
    print("zqdb/ogr2ogr to SQLite: %.2fx (target >= 5x)" % (results["ogr2ogr sqlite"][0] / results["zqdb sqlite"][0]))
    print("zqdb/pgdbf to pgsql:    %.2fx (target >= 2x)" % (results["pgdbf"][0] / results["zqdb pgsql"][0]))


if __name__ == "__main__":
    main()
