"""A reindex killed part way leaves the old index files whole.

A table of 1,000,000 records with a memo file and a production index (a
dBASE IV table with an MDX tag, a FoxPro one with a CDX tag), made once by
`zqdb convert` from a generated CSV file. `zqdb reindex` is killed with
SIGKILL at points found by watching its staging directory beside the table:
as soon as the directory appears, 0.2 s after the start, when the new file
is half written, when it is whole (before its rename), and when it has been
renamed but the directory is not yet removed. After each kill the index file
is byte for byte the old one, or, once the new one was renamed into place,
the new one. Then a whole reindex removes what the killed runs left, check
is clean, and the table and memo file are what they were. (The first record
is deleted behind the index's back first, so that the new file differs from
the old.)

This case takes about half a minute, so it runs once, here in the optimised
build (the sanitizer build runs no interop tests).
"""

import hashlib
import os
import shutil
import struct
import subprocess
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import must, Suite, workdir, ZQDB  # noqa: E402

RECORDS = 1_000_000
STAGING = ".zqdb-reindex-"
TABLES = [("MDX", "dBASE IV", ".mdx", ".dbt"), ("CDX", "foxpro", ".cdx", ".fpt")]

s = Suite("reindex_killed")


def write_csv(path):
    """ID, a key of 8 hex digits in no order, and a memo on one record in ten."""
    with open(path, "w", newline="") as f:
        f.write("ID,K,NOTE\r\n")
        for start in range(1, RECORDS + 1, 100_000):
            f.write("".join("%d,%08x,%s\r\n" % (i, i * 2654435761 % 2**32, "memo of record %d" % i if i % 10 == 0 else "")
                            for i in range(start, min(start + 100_000, RECORDS + 1))))


def digest(path):
    with open(path, "rb") as f:
        return hashlib.sha256(f.read()).hexdigest()


def staged(d, ext, pid=None):
    """(staging directory, its new index file) of the reindex `pid`, or of
    any; None for each that isn't there. (A run removes the staging
    directories that killed runs left, so only its own tells its progress.)"""
    for name in os.listdir(d):
        if name.startswith(STAGING) and (pid is None or name.endswith("-%d" % pid)):
            stage = os.path.join(d, name)
            try:
                files = [os.path.join(stage, f) for f in os.listdir(stage) if f.endswith(ext)]
            except FileNotFoundError:
                return None, None
            return stage, files[0] if files else None
    return None, None


def size(path):
    try:
        return os.path.getsize(path)
    except (FileNotFoundError, TypeError):
        return -1


def kill_when(table, ext, when):
    """Starts a reindex of `table` and kills it with SIGKILL as soon as
    `when(seconds, staging directory, staged file)` holds. True when it was
    killed, False when it ended first."""
    d = os.path.dirname(table)
    p = subprocess.Popen([ZQDB, "reindex", table], stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    t0 = time.monotonic()
    while p.poll() is None:
        if when(time.monotonic() - t0, *staged(d, ext, p.pid)):
            p.kill()
            p.wait()
            return True
        time.sleep(0.0005)
    return False


def renamed():
    """A kill point: the staging directory is still there, and the new file
    that stood in it is gone."""
    seen = [False]

    def when(t, stage, f):
        seen[0] = seen[0] or f is not None
        return seen[0] and stage is not None and f is None
    return when


def killed_runs(label, d, dialect, ext, memo_ext, csv):
    table = os.path.join(d, label + ".dbf")
    index, memo = table[:-4] + ext, table[:-4] + memo_ext
    must([ZQDB, "convert", csv, table, "--to", dialect, "--schema", "ID N(8), K C(8), NOTE M", "--index", "K=K",
          "--no-progress"])
    # The first record deleted behind the index's back: its key stays in the
    # old file and not in the new one, so that the two differ.
    with open(table, "r+b") as f:
        f.seek(struct.unpack("<H", f.read(10)[8:])[0])
        f.write(b"*")
    before = {f: digest(f) for f in (table, memo)}
    old = digest(index)
    # The new file's bytes and length, from a whole reindex of a copy.
    copy = os.path.join(d, "copy")
    os.mkdir(copy)
    for f in (table, memo, index):
        shutil.copy(f, copy)
    must([ZQDB, "reindex", os.path.join(copy, os.path.basename(table))])
    new_index = os.path.join(copy, os.path.basename(index))
    new, new_size = digest(new_index), os.path.getsize(new_index)
    shutil.rmtree(copy)
    s.check(label + " the new file differs from the old", new != old)

    points = [
        ("the staging directory made", lambda t, stage, f: stage is not None),
        ("0.2 s", lambda t, stage, f: t >= 0.2),
        ("the new file half written", lambda t, stage, f: size(f) >= new_size // 2),
        ("the new file whole", lambda t, stage, f: size(f) >= new_size),
        ("the new file renamed", renamed()),
    ]
    current = old
    for point, when in points:
        killed = kill_when(table, ext, when)
        stage, left = staged(d, ext)
        got = digest(index)
        what = "%s %s killed at %s" % (label, os.path.basename(index), point)
        if left is not None:  # not yet renamed: the old file it stands beside
            s.check(what + ": old file whole", got == current, "killed %s" % killed)
        else:
            s.check(what + ": old or new file whole", got in (current, new), "killed %s" % killed)
        current = got
    rc = subprocess.run([ZQDB, "reindex", table], capture_output=True).returncode
    s.check(label + " reindex after the kills", rc == 0 and digest(index) == new)
    s.check(label + " staging directories removed", staged(d, ext) == (None, None), str(os.listdir(d)))
    s.check(label + " table and memo file unchanged", {f: digest(f) for f in before} == before)
    s.check_clean(label, table)
    for f in (table, memo, index):
        os.unlink(f)


with workdir() as d:
    csv = os.path.join(d, "rows.csv")
    write_csv(csv)
    for label, dialect, ext, memo_ext in TABLES:
        with s.case(label):
            killed_runs(label, d, dialect, ext, memo_ext, csv)
s.done()
