#!/usr/bin/python3
"""Tables with one memo per record, memos of 0 to 2,000 bytes, in two memo
kinds: dBASE III (version byte 0x83, DBT with 512-byte blocks) and FoxPro
(0xF5, FPT with 64-byte blocks).

    bench_memo.py PATH_TO_ZQDB [SIZE...]     (sizes: 100,000 and 1,000,000)

Read: the tables are generated here, table and memo file written directly
(standard library only), into bench/data/ on first use. zqdb reads them to
CSV side by side with pgdbf (which reads the memo file given with -m) and
python3-dbfread. dbfread reads the first 100,000 records of each table (its
rate does not depend on the table's size, and a million records take it
minutes); its rate is taken from those.

Append: memo_table_writer (built beside zqdb) creates a table of each kind
and appends N records, each with a memo of 0 to 2,000 bytes, through the
plain functions (dbcreat, dbopen, putmemo, dbput, dbclose).

Times are CPU seconds (user + system) of the fastest run, as bench.py counts
them, since the machine is shared; rates count records per CPU second.
"""

import json
import os
import struct
import subprocess
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import gen_table  # noqa: E402
from bench import timed  # noqa: E402

HERE = os.path.dirname(os.path.abspath(__file__))
DATA = os.path.join(HERE, "data")
SIZES = [100_000, 1_000_000]
DBFREAD_RECORDS = 100_000
KINDS = {"dbt": (0x83, 1), "fpt": (0xF5, 6)}  # memo kind: (version byte, zqdb dialect)

FIELDS = [("ID", b"N", 8, 0), ("NAME", b"C", 30, 0), ("AMOUNT", b"N", 12, 2), ("BORN", b"D", 8, 0),
          ("NOTE", b"M", 10, 0)]
RECORD_LEN = 1 + sum(f[2] for f in FIELDS)
HEADER_LEN = 32 + 32 * len(FIELDS) + 1
MEMO_HEADER = 512
DBT_BLOCK, FPT_BLOCK = 512, 64
NAMES = [(b"%s %s" % (f, l)).ljust(30) for f in (b"Anna", b"Bernd", b"Chlo\xe9", b"Dmitri", b"Elif", b"Franz")
         for l in (b"M\xfcller", b"Schmidt", b"Garc\xeda", b"Rossi", b"Novak", b"Dubois", b"Jensen")]

# Every memo is a slice of this text (words, line breaks, no 0x1A).
POOL = b"".join(b"memo word %d%s" % (k, b"\r\n" if k % 9 == 8 else b" ") for k in range(800))
assert len(POOL) > 4100

DBFREAD_LOOP = ("import dbfread, itertools, sys\n"
                "t = dbfread.DBF(sys.argv[1], encoding='cp1252')\n"
                "n = sum(1 for _ in itertools.islice(t, int(sys.argv[2])))\n"
                "print(n)\n")


def memo_text(i):
    """Record i's memo: 0 to 2,000 bytes, about one in 40 empty."""
    n = (i * 7919) % 2001 if i % 40 else 0
    start = (i * 131) % 2000
    return POOL[start:start + n]


def generate(path, kind, n):
    """Writes the table `path` with n records and its memo file of `kind`."""
    version = KINDS[kind][0]
    block_size = DBT_BLOCK if kind == "dbt" else FPT_BLOCK
    memo_path = path[:-4] + "." + kind
    block = MEMO_HEADER // block_size
    recs, memos = [], []
    with open(path, "wb") as t, open(memo_path, "wb") as m:
        t.write(gen_table.header(n, FIELDS, version))
        m.write(b"\0" * MEMO_HEADER)
        for i in range(n):
            text = memo_text(i)
            if text:
                if kind == "dbt":  # text ended by 0x1A
                    stored = text + b"\x1a"
                else:  # big-endian type 1 (text) and length, then the text
                    stored = struct.pack(">II", 1, len(text)) + text
                stored += b"\0" * (-len(stored) % block_size)
                memos.append(stored)
                pointer = b"%010d" % block
                block += len(stored) // block_size
            else:
                pointer = b" " * 10
            recs.append(b" %8d%s%12.2f%04d%02d%02d%s" % (
                i + 1, NAMES[i % len(NAMES)], ((i * 7919) % 1000000 - 200000) / 100,
                1940 + i % 60, 1 + i % 12, 1 + i % 28, pointer))
            if len(recs) == 32768:
                t.write(b"".join(recs))
                m.write(b"".join(memos))
                recs.clear()
                memos.clear()
        t.write(b"".join(recs) + b"\x1a")
        m.write(b"".join(memos))
        # Memo header: the next free block, little-endian in DBT and
        # big-endian in FPT, which also keeps its block size at offset 6.
        m.seek(0)
        if kind == "dbt":
            m.write(struct.pack("<I", block))
        else:
            m.write(struct.pack(">IHH", block, 0, block_size))
    return memo_path


def table(kind, n):
    path = os.path.join(DATA, "memo_gen_%s_%d.dbf" % (kind, n))
    memo_path = path[:-4] + "." + kind
    if not (os.path.exists(memo_path) and os.path.getsize(path) == HEADER_LEN + RECORD_LEN * n + 1):
        os.makedirs(DATA, exist_ok=True)
        print("generating %s ..." % os.path.relpath(path), flush=True)
        generate(path, kind, n)
    return path, memo_path


def check_read(zqdb, path, dialect):
    """zqdb gives back the generated memos (every 997th record checked), so
    that the rates below are rates of a reader that reads them."""
    p = subprocess.run([zqdb, "cat", path, "--dialect", str(dialect), "--format", "jsonl"],
                       capture_output=True, check=True)
    rows = p.stdout.splitlines()
    bad = [i for i in range(0, len(rows), 997)
           if (json.loads(rows[i])["NOTE"] or "") != memo_text(i).decode("cp1252")]
    if bad:
        raise SystemExit("zqdb read other memos than were written, first at record %d" % bad[0])


def main():
    zqdb = os.path.abspath(sys.argv[1])
    writer = os.path.join(os.path.dirname(zqdb), "memo_table_writer")
    sizes = [int(a) for a in sys.argv[2:]] or SIZES
    reads, appends = [], []
    for n in sizes:
        for kind, (_, dialect) in KINDS.items():
            path, memo_path = table(kind, n)
            if n == min(sizes):
                check_read(zqdb, path, dialect)
            runs = 3 if n <= 100_000 else 2
            zq = timed([zqdb, "cat", path, "--dialect", str(dialect), "--format", "csv"], runs)
            pg = timed(["pgdbf", "-m", memo_path, path], runs)
            k = min(n, DBFREAD_RECORDS)
            dr = timed(["/usr/bin/python3", "-c", DBFREAD_LOOP, path, str(k)], 1)
            reads.append((kind, n, zq, pg, (k, dr)))
            print("read %s %9d: CPU (wall) s: zqdb %.2f (%.2f), pgdbf %.2f (%.2f), dbfread %.2f for %d records" % (
                kind, n, zq[0], zq[2], pg[0], pg[2], dr[0], k), flush=True)

            out = os.path.join(DATA, "memo_append_%s_%d.dbf" % (kind, n))
            for ext in (".dbf", "." + kind):
                if os.path.exists(out[:-4] + ext):
                    os.remove(out[:-4] + ext)
            ap = timed([writer, out, str(dialect), str(n), "--append"], 1)
            size = os.path.getsize(out) + os.path.getsize(out[:-4] + "." + kind)
            appends.append((kind, n, ap, size))
            print("append %s %9d: CPU (wall) s: %.2f (%.2f), %.0f MiB written" % (
                kind, n, ap[0], ap[2], size / 2**20), flush=True)
            os.remove(out)
            os.remove(out[:-4] + "." + kind)

    print("\nRead to CSV, records per CPU second")
    print("%-4s %9s %12s %12s %14s %11s %13s %10s" % (
        "memo", "records", "zqdb", "pgdbf", "dbfread", "zqdb/pgdbf", "zqdb/dbfread", "zqdb RSS"))
    for kind, n, zq, pg, (k, dr) in reads:
        zr, pr, drr = n / zq[0], n / pg[0], k / dr[0]
        print("%-4s %9d %12.0f %12.0f %13.0f%s %10.2fx %12.1fx %6.1f MiB" % (
            kind, n, zr, pr, drr, "*" if k < n else " ", zr / pr, zr / drr, zq[1] / 1024))
    if any(k < n for _, n, _, _, (k, _) in reads):
        print("* dbfread: rate over the first %d records" % DBFREAD_RECORDS)
    print("targets: zqdb/pgdbf >= 3x, zqdb/dbfread >= 10x")
    print("\nAppend through the plain functions")
    print("%-4s %9s %14s %10s" % ("memo", "records", "records/s", "MiB"))
    for kind, n, ap, size in appends:
        print("%-4s %9d %14.0f %10.0f" % (kind, n, n / ap[0], size / 2**20))


if __name__ == "__main__":
    main()
