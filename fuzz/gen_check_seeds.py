#!/usr/bin/env python3
"""Writes the seeds of the check fuzz target to fuzz/corpus/check/.

    python3 fuzz/gen_check_seeds.py build/zqdb

Each seed is a table with a memo field and a production index, made by zqdb
itself from a CSV file, and packed as fuzz/check_fuzz.cpp reads its input: a
byte for the kind (0 dBASE IV with .dbt and .mdx, 1 FoxPro with .fpt and
.cdx), the table's and the memo file's lengths (16 bits each, little-endian),
then the three files. A few records with short keys make a tree of one block;
keys of 100 bytes that share nothing make a tree of two levels in a few KB.
Run it again after a change to the formats; it rewrites the same files.
"""
import os
import random
import struct
import subprocess
import sys
import tempfile

OUT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "corpus", "check")


def seed(zqdb, d, name, fox, width, keys):
    csv = os.path.join(d, name + ".csv")
    with open(csv, "w") as f:
        f.write("NAME,NOTE\n")
        for i, k in enumerate(keys):
            f.write("%s,%s\n" % (k, "note %d" % i if i % 4 == 0 else ""))
    table = os.path.join(d, name + ".dbf")
    subprocess.run([zqdb, "convert", csv, table, "--schema", "NAME C(%d), NOTE M" % width,
                    "--index", "NAME=NAME", "--no-progress"] + (["--to", "foxpro"] if fox else []),
                   check=True)
    parts = [open(os.path.join(d, name + ext), "rb").read()
             for ext in ((".dbf", ".fpt", ".cdx") if fox else (".dbf", ".dbt", ".mdx"))]
    with open(os.path.join(OUT, name), "wb") as f:
        f.write(struct.pack("<BHH", 1 if fox else 0, len(parts[0]), len(parts[1])) + b"".join(parts))


def main():
    zqdb = os.path.abspath(sys.argv[1])
    os.makedirs(OUT, exist_ok=True)
    rng = random.Random(3)
    long_keys = ["".join(rng.choice("abcdefghijklmnopqrstuvwxyz") for _ in range(100)) for _ in range(10)]
    with tempfile.TemporaryDirectory() as d:
        for fox in (False, True):
            kind = "fox" if fox else "dbase"
            seed(zqdb, d, kind + "_leaf", fox, 10, ["bob", "ann", "cid", "ann", "dan"])
            seed(zqdb, d, kind + "_levels", fox, 100, long_keys)


main()
