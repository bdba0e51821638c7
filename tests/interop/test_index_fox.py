"""FoxPro index files against Perl XBase.

1. Non-compact IDX files and CDX tags that `zqdb convert --index` writes over
   character fields, in FoxPro and Visual FoxPro tables, from one leaf to
   trees of four and more levels and of 100,000 keys, keys in random order
   with long runs of equal keys: Perl XBase walks them in the order and with
   the record numbers that `zqdb keys` gives, one key per live record, and
   its seek lands on the first record of every distinct key.
2. Append and update (no index option) keep every CDX tag current: each new
   record's key is in both tags; after an update the tags are rebuilt, so
   each record has its one new key, for zqdb and for Perl, and check is clean.
3. The other way: IDX files that `XBase::idx->create` writes, and CDX tags
   that Perl's `insert` fills in an empty CDX that zqdb made, are walked by
   `zqdb keys` as Perl walks them. A table that python3-dbf wrote, given such
   a tag, keeps it current when zqdb appends to it. check finds nothing in
   them.
4. Stale indexes: records that python3-dbf appends (it keeps no index
   current) and a key byte changed, in a CDX tag and an IDX file, are found
   by check and mended by reindex, and Perl walks the rebuilt files as zqdb.
(No program here reads compact IDX files; the unit tests check those.)
"""

import os
import random
import shutil
import struct
import sys

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, HERE)
from common import must, Suite, workdir, write_csv, ZQDB  # noqa: E402
from index_common import (append_keys, check_index, convert, draw, key_pool, perl_walk, stale_and_mended,  # noqa: E402
                          stale_table, status, tags_hold, write_keys, zq_keys)

import dbf  # noqa: E402

# (label, dialect, records, field width, distinct keys, fewest CDX and IDX
# levels, changes). A key of 100 bytes leaves 4 entries to an interior node,
# so a few thousand records make a deep tree. Changes: "append" adds records,
# "update" gives some records new keys and adds others.
TREES = [
    ("one leaf", "foxpro", 12, 8, 5, 1, 1, ("append", "update")),
    ("four levels", "Visual FoxPro", 4000, 100, 1500, 4, 4, ("append", "update")),
    ("100,000 keys", "foxpro", 100_000, 32, 30_000, 4, 4, ()),
]
CHANGED = 300  # records appended, and records touched by an update

# Fills tag K of a CDX (argv: table, CDX) with the key of every record, as
# Perl's insert does it, one key at a time. It prints its splits: ignored.
PERL_INSERT = r'''
use strict; use XBase; use XBase::Index;
my $t = XBase->new($ARGV[0]) or die XBase->errstr;
my $ix = XBase::Index->new($ARGV[1], tag => "K", type => "C") or die XBase::Index->errstr;
for my $i (0 .. $t->last_record) { my (undef, $k) = $t->get_record($i, "K"); $ix->insert($k, $i + 1) }
'''
PERL_IDX = ('use XBase; use XBase::Index; my $t = XBase->new($ARGV[0]) or die XBase->errstr;'
            ' XBase::idx->create($t, $ARGV[1], "K")')
# Records of the tables Perl indexes: a C(10) key gives 35 entries to a page
# of Perl's IDX, so these make one to four leaf pages; Perl's insert keeps a
# CDX tag of up to about 2,000 such keys in two levels.
PERL_IDX_RECORDS = [20, 35, 36, 100, 140]
# Perl's IDX links its leaves by block number where the format has byte
# offsets: zqdb reads such a link as a block number, so it walks them whole.
PERL_CDX_RECORDS = [1, 30, 1000, 1800]

s = Suite("index_fox")


def levels(index, header):
    """The depth of a Fox index whose tree header is at `header`, down its
    first entries. Header: root offset at 0, key length at 12 (both little-
    endian). Node: attributes at 0 (2 = leaf), entries from 12, in an
    interior node a key, the record number and the child's offset, the two
    numbers big-endian; a non-compact IDX leaves out the record number."""
    with open(index, "rb") as f:
        data = f.read()
    node, keylen = struct.unpack_from("<IH", data, header)[0], struct.unpack_from("<H", data, header + 12)[0]
    child_at = 12 + keylen + (4 if index.lower().endswith(".cdx") else 0)
    depth = 1
    while not struct.unpack_from("<H", data, node)[0] & 2:
        node, depth = struct.unpack_from(">I", data, node + child_at)[0], depth + 1
    return depth


# zqdb writes a CDX's tag list first (header and root, 1024 + 512 bytes),
# then each tag's header at the end of the file: the first tag's at 1536.
FIRST_TAG = 1536


# --- 1 and 2: zqdb's files walked by Perl -----------------------------------

def character_trees(d):
    for label, dialect, n, width, distinct, cdx_levels, idx_levels, changes in TREES:
        with s.case(label):
            rng = random.Random(n)
            pool = key_pool(rng, width, distinct)
            keys = draw(rng, pool, n)
            idx = os.path.join(d, "k%d.idx" % n)
            more = ["--index", "G=G"] if changes else []
            table = convert(d, "t%d" % n, keys, "--to", dialect, "--schema", "ID N(7), K C(%d), G C(6)" % width,
                            "--index", "K=K", "--index", idx + "=K", "--index-form", "plain", *more)
            recs = dict(enumerate(keys, 1))
            cdx = table[:-4] + ".cdx"
            got = (levels(cdx, FIRST_TAG), levels(idx, 0))
            s.check(label + " depth", got[0] >= cdx_levels and got[1] >= idx_levels, "CDX %d, IDX %d levels" % got)
            check_index(s, label + " CDX", table, cdx, "K", [(k, r) for r, k in recs.items()])
            check_index(s, label + " IDX", table, idx, None, [(k, r) for r, k in recs.items()])
            if changes:
                change(d, label, table, rng, pool, recs)


def change(d, label, table, rng, pool, recs):
    """Append, then update by ID: half the source names records of the table
    (their keys change, and the rebuilt tags hold the new key only), half are
    new."""
    pool, cdx = pool + ["new %d" % i for i in range(100)], table[:-4] + ".cdx"
    csv = os.path.join(d, "more.csv")
    append_keys(s, d, label + " append", table, cdx, draw(rng, pool, CHANGED), recs)
    ids = rng.sample(sorted(recs), CHANGED // 2) + list(range(len(recs) + 1, len(recs) + 1 + CHANGED // 2))
    rows = [(i, k, status(i)) for i, k in zip(ids, draw(rng, pool, len(ids)))]
    write_csv(csv, ("ID", "K", "G"), rows)
    must([ZQDB, "convert", csv, table, "--mode", "update", "--key", "ID", "--no-progress"])
    recs.update((i, k) for i, k, _ in rows)
    tags_hold(s, label + " update", table, cdx, recs)
    must([ZQDB, "check", table])


# --- 3: Perl's files walked by zqdb -----------------------------------------

def same_walk(label, table, index, tag, n, *zq_opts):
    walk, _ = perl_walk(index, tag or "")
    s.check(label + " Perl count", len(walk) == n, "%d keys, %d records" % (len(walk), n))
    for opts in ((), ("--reverse",)):
        zq = zq_keys(table, tag or index, *opts, *zq_opts)
        want = walk[::-1] if opts else walk
        what = "%s zqdb walk%s" % (label, " backwards" if opts else "")
        s.check(what, zq == want, "zqdb %d keys, Perl %d: %s / %s" % (len(zq), len(want), zq[:3], want[:3]))


def perl_keys(d, rng, name, n):
    """A FoxPro table of n records without an index, keys of up to 10 bytes."""
    pool = key_pool(rng, 10, max(2, n // 3))
    return convert(d, name, draw(rng, pool, n), "--to", "foxpro", "--schema", "ID N(7), K C(10), G C(6)")


def perl_files(d):
    rng = random.Random(7)
    for n in PERL_IDX_RECORDS:
        label = "Perl's IDX of %d records" % n
        with s.case(label):
            table = perl_keys(d, rng, "pi%d" % n, n)
            idx = os.path.join(d, "pi%d.idx" % n)
            must(["perl", "-e", PERL_IDX, table, idx])
            same_walk(label, table, idx, None, n, "--dialect", "foxpro")
            s.check_clean(label, table, "--index", idx, "--dialect", "foxpro")

    # An empty CDX with tag K, of a table with no records.
    empty = convert(d, "empty", [], "--to", "foxpro", "--schema", "ID N(7), K C(10), G C(6)", "--index", "K=K")
    for n in PERL_CDX_RECORDS:
        label = "Perl's CDX tag of %d records" % n
        with s.case(label):
            table = perl_keys(d, rng, "pc%d" % n, n)
            perl_insert(empty, table)
            s.check(label + " depth", levels(table[:-4] + ".cdx", FIRST_TAG) == (1 if n < 100 else 2))
            same_walk(label, table, table[:-4] + ".cdx", "K", n)
            s.check_clean(label, table)

    with s.case("python3-dbf's table"):
        table = os.path.join(d, "py.dbf")
        t = dbf.Table(table, "ID N(7,0); K C(10); G C(6)", dbf_type="db3")  # 0x03 as FoxPro writes it ("fp" writes 0)
        t.open(dbf.READ_WRITE)
        keys = draw(rng, key_pool(rng, 10, 40), 150)
        for i, k in enumerate(keys, 1):
            t.append((i, k, status(i)))
        t.close()
        perl_insert(empty, table)
        more = draw(rng, key_pool(rng, 10, 40), 200)
        write_keys(os.path.join(d, "py_more.csv"), more, len(keys) + 1)
        must([ZQDB, "convert", os.path.join(d, "py_more.csv"), table, "--mode", "append", "--no-progress"])
        same_walk("python3-dbf's table", table, table[:-4] + ".cdx", "K", len(keys) + len(more))
        s.check("python3-dbf's table keys", sorted(zq_keys(table, "K")) == sorted(
            (k, r) for r, k in enumerate(keys + more, 1)))
        s.check_clean("python3-dbf's table", table)


def perl_insert(empty, table):
    """Gives `table` a copy of zqdb's empty CDX and lets Perl fill its tag."""
    cdx = table[:-4] + ".cdx"
    shutil.copyfile(empty[:-4] + ".cdx", cdx)
    must(["perl", "-e", PERL_INSERT, table, cdx])


def stale(d):
    with s.case("stale CDX and IDX"):
        idx = os.path.join(d, "stale.idx")
        table, keys = stale_table(d, "stale", 30, "--to", "foxpro", "--index", "K=K", "--index", idx + "=K",
                                  "--index-form", "plain")
        t = dbf.Table(table)
        t.open(dbf.READ_WRITE)
        for i in range(1, 21):
            t.append((100 + i, "py%d" % i, "q"))
        t.close()
        stale_and_mended(s, "stale", table, keys, table[:-4] + ".cdx", "K", idx,
                         {30 + i: "py%d" % i for i in range(1, 21)})


with workdir() as d:
    character_trees(d)
    perl_files(d)
    stale(d)
s.done()
