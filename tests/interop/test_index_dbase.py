"""dBASE index files against independent programs.

1. NDX files and MDX tags that `zqdb convert --index` writes over character
   fields, from one leaf to trees of four and more levels and of 100,000
   keys, keys in random order with long runs of equal keys: Perl XBase
   (XBase::Index) walks them in the order and with the record numbers that
   `zqdb keys` gives, with one key per live record, and its seek lands on
   the first record of every distinct key. Perl walks part of a tree without
   an error when a header names an old root, so the counts are checked too.
2. Append (no index option) to a table with two MDX tags: the new records'
   keys are in both tags, for zqdb and for Perl.
3. Numeric keys are 8-byte doubles, compared as bytes. Perl reads them from
   an NDX file (whose key type word says character) and from an MDX tag as
   the 8 bytes they are, not as numbers: it walks them in zqdb's order, which
   is not value order, and its seek by those bytes finds every key.
4. libxbase64 (a small program compiled here against libxbase64-dev): NDX
   files that it builds over a table zqdb writes are walked by `zqdb keys`,
   forwards and backwards, as libxbase64 walks them, and it walks zqdb's
   deep NDX file both ways as zqdb does; check finds nothing in them but
   what libxbase64 gets wrong.
5. Stale indexes: records that Perl XBase appends (it keeps no index
   current) and a key byte changed, in an MDX tag and an NDX file, are found
   by check and mended by reindex, and Perl walks the rebuilt files as zqdb.
"""

import os
import random
import struct
import sys

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, HERE)
from common import must, Suite, workdir, write_csv, ZQDB  # noqa: E402
from index_common import (append_keys, check_index, convert, draw, first_records, key_pool, perl_walk,  # noqa: E402
                          stale_and_mended, stale_table, zq_keys)

# (label, records, field width, distinct keys, fewest MDX and NDX levels)
# A key of 100 bytes leaves 9 entries to an MDX node and 4 to an NDX node,
# so a few thousand records make a deep tree. libxbase64 reads the entries
# of an NDX node 8 + key length bytes apart, whatever the entry length in the
# header, and takes a node for 1024 bytes when its keys fill more than 496 of
# the 512: the widths here are those that it reads right.
TREES = [
    ("one leaf", 12, 8, 5, 1, 1),
    ("four levels", 4000, 100, 1500, 4, 6),
    ("100,000 keys", 100_000, 32, 30_000, 4, 5),
]
# The four-level table gets a second tag, over a field of a few values in
# long runs, and then records appended to it.
APPEND_TO, APPENDED = "four levels", 1500

s = Suite("index_dbase")


def levels(index, tag=None):
    """The depth of an NDX file (tag None) or an MDX tag, down its first
    entries. NDX: header root block at 0; node: count at 0, entries from 4,
    an entry's child block first (0 in a leaf). MDX: tag table from 544 in
    32-byte entries (header block, name); tag header: root block at 0, entry
    size at 18; node: count at 0, entries from 8, child block first, and
    behind the last entry a word that is 0 in a leaf."""
    with open(index, "rb") as f:
        data = f.read()
    le32 = lambda at: struct.unpack_from("<I", data, at)[0]  # noqa: E731
    if tag is None:
        node, depth = le32(0) * 512, 1
        while le32(node + 4):
            node, depth = le32(node + 4) * 512, depth + 1
        return depth
    at = next(544 + 32 * i for i in range(47) if data[548 + 32 * i:559 + 32 * i].rstrip(b"\0") == tag.encode())
    header = le32(at) * 512
    entry = struct.unpack_from("<H", data, header + 18)[0]
    node, depth = le32(header) * 512, 1
    while le32(node + 8 + le32(node) * entry):
        node, depth = le32(node + 8) * 512, depth + 1
    return depth


def pairs(recs):
    return [(k, r) for r, k in recs.items()]


# --- 1 and 2: character keys ------------------------------------------------

def character_trees(d, tool):
    for label, n, width, distinct, mdx_levels, ndx_levels in TREES:
        with s.case(label):
            rng = random.Random(n)
            pool = key_pool(rng, width, distinct)
            keys = draw(rng, pool, n)
            ndx = os.path.join(d, "k%d.ndx" % n)
            more = ["--index", "G=G"] if label == APPEND_TO else []
            table = convert(d, "t%d" % n, keys, "--schema", "ID N(7), K C(%d), G C(6)" % width,
                            "--index", "K=K", "--index", ndx + "=K", *more)
            recs = dict(enumerate(keys, 1))
            mdx = table[:-4] + ".mdx"
            got = (levels(mdx, "K"), levels(ndx))
            s.check(label + " depth", got[0] >= mdx_levels and got[1] >= ndx_levels,
                    "MDX %d, NDX %d levels" % got)
            check_index(s, label + " MDX", table, mdx, "K", pairs(recs))
            check_index(s, label + " NDX", table, ndx, None, pairs(recs))
            if tool:
                same_as_xbase64(label + " NDX", tool, table, ndx)
            if label == APPEND_TO:
                more = draw(rng, pool + ["new %d" % i for i in range(100)], APPENDED)
                append_keys(s, d, "append", table, mdx, more, recs)


# --- 3: numeric keys ----------------------------------------------------------

NUMBERS = [3, -2.5, 0, 1, 1000000, -7, 0.5, 2, 3, -0.25, 100]


def numeric_keys(d):
    """zqdb's walk is in the order of the doubles' bytes, little-endian, not
    in value order. Perl reads the keys of an NDX file (whose key type word
    says character) and of an MDX tag as the 8 bytes they are: it walks them
    in zqdb's order, and a seek by those bytes finds each key."""
    with s.case("numeric keys"):
        ndx = os.path.join(d, "n.ndx")
        table = convert(d, "num", NUMBERS, "--schema", "ID N(3), K N(10,2)", "--index", "NK=K",
                        "--index", ndx + "=K")
        want = sorted((struct.pack("<d", v).hex(), r) for r, v in enumerate(NUMBERS, 1))
        for index, tag in ((ndx, ""), (table[:-4] + ".mdx", "NK")):
            zq = [(struct.pack("<d", float(k)).hex(), r) for k, r in zq_keys(table, tag or index)]
            s.check("numeric zqdb walk " + (tag or "NDX"), zq == want, repr(zq))
            first = first_records(want)
            walk, found = perl_walk(index, tag, seek=list(first), form="hex")
            s.check("numeric Perl walk " + (tag or "NDX"), walk == want, repr(walk))
            s.check("numeric Perl seek " + (tag or "NDX"), found == list(first.items()), repr(found))
        # zqdb's keys in the order of their bytes are whole; two entries of the
        # one leaf swapped (block 1; count, then 16-byte entries of child,
        # record number, key) are in neither that order nor value order.
        s.check_clean("numeric keys", table, "--index", ndx)
        with open(ndx, "r+b") as f:
            f.seek(516)
            two = f.read(32)
            f.seek(516)
            f.write(two[16:] + two[:16])
        s.check_clean("numeric keys swapped", table, "--index", ndx, finds="the keys are out of order")


# --- 4: NDX files of libxbase64 ----------------------------------------------

# Key lengths are multiples of 4, as above: libxbase64 also writes the
# entries of other key lengths closer together than its header says. It sizes
# a SUBSTR key now 3, now 4 bytes for the same table, so there is none here.
XB_ROWS = [("bob", 3, "2001-02-03"), ("al", 1, "1999-12-31"), ("bob", 2, "1900-01-01"), ("cy", -5.5, ""),
           ("", 0, "2024-02-29"), ("Al", 1e5, "1970-01-01"), ("al", -0.5, "2000-02-29")]
XB_SCHEMA = "NAME C(8), QTY N(9,2), BORN D"
# What check finds in libxbase64's file, None for nothing. It orders numeric
# keys by value, as dBASE does, where zqdb orders their bytes: both are
# whole. It keeps 8 of the 12 bytes of NAME+DTOS(BORN) over a C(4) field. Its
# tree of 20,000 keys is damaged: its own walk misses some records and
# meets others twice.
XB_CASES = [  # (expression, schema, rows, fewest levels, finding)
    ("NAME", XB_SCHEMA, XB_ROWS, 1, None),
    ("NAME+DTOS(BORN)", "NAME C(4), QTY N(9,2), BORN D", XB_ROWS, 1, "differs from 'bob 20010203'"),
    ("QTY", XB_SCHEMA, XB_ROWS, 1, None),
    # libxbase64 keeps a date as its 8 characters YYYYMMDD in a character
    # index, and zqdb reads a date key as a double: only the order and the
    # record numbers are compared.
    ("BORN", XB_SCHEMA, XB_ROWS, 1, "key '19000101' differs from"),
    ("NAME", XB_SCHEMA, [("".join(random.Random(i).choices("abcdefgh", k=i % 8 + 1)), i, "") for i in range(20000)], 3,
     "has no key in the index"),
]


def xbase64_tool(d):
    """The libxbase64 program, compiled into d; None when that fails."""
    tool = os.path.join(d, "xbase64_ndx")
    with s.case("libxbase64 tool"):
        must(["g++", "-std=c++17", "-O1", "-w", os.path.join(HERE, "xbase64_ndx.cpp"), "-o", tool, "-lxbase64"])
        return tool
    return None


def same_as_xbase64(label, tool, table, ndx, keys=None):
    """libxbase64 walks `ndx` forwards and backwards with the record numbers
    of zqdb's walks; with `keys` (recno - 1 -> key) zqdb's keys are those."""
    for direction in ("forwards", "backwards"):
        theirs = [int(r) for r in must([tool, "walk", table, ndx, direction]).split()]
        ours = zq_keys(table, ndx, *(["--reverse"] if direction == "backwards" else []))
        s.check("%s libxbase64 %s" % (label, direction), [r for _, r in ours] == theirs,
                "zqdb %s, libxbase64 %s" % (ours[:10], theirs[:10]))
        if keys:
            s.check("%s libxbase64 %s keys" % (label, direction),
                    [k for k, _ in ours] == [keys[r - 1] for r in theirs], repr(ours[:10]))


def libxbase64_files(d, tool):
    table, ndx, csv = (os.path.join(d, "xb" + ext) for ext in (".dbf", ".ndx", ".csv"))
    for expr, schema, rows, depth, finding in XB_CASES:
        label = "libxbase64's %s, %d records" % (expr, len(rows))
        with s.case(label):
            write_csv(csv, ("NAME", "QTY", "BORN"), rows)
            must([ZQDB, "convert", csv, table, "--schema", schema, "--no-progress"])
            must([tool, "index", table, ndx, expr])
            s.check(label + " depth", levels(ndx) >= depth, "%d levels" % levels(ndx))
            same_as_xbase64(label, tool, table, ndx, [r[0] for r in rows] if expr == "NAME" else None)
            s.check_clean(label, table, "--index", ndx, finds=finding)


# --- 5: stale indexes --------------------------------------------------------

# Appends argv[1] records to the table argv[0]: ID 100 + i, K "new" i.
PERL_APPEND = r'''
use strict; use XBase;
my $t = XBase->new($ARGV[0]) or die XBase->errstr;
for my $i (1 .. $ARGV[1]) { $t->set_record($t->last_record + 1, 100 + $i, "new$i", "p") or die $t->errstr }
$t->close;
'''


def stale(d):
    with s.case("stale MDX and NDX"):
        ndx = os.path.join(d, "stale.ndx")
        table, keys = stale_table(d, "stale", 30, "--to", "dBASE IV", "--index", "K=K", "--index", ndx + "=K")
        must(["perl", "-e", PERL_APPEND, table, "20"])
        stale_and_mended(s, "stale", table, keys, table[:-4] + ".mdx", "K", ndx,
                         {30 + i: "new%d" % i for i in range(1, 21)})


with workdir() as d:
    xbase64 = xbase64_tool(d)
    character_trees(d, xbase64)
    numeric_keys(d)
    stale(d)
    if xbase64:
        libxbase64_files(d, xbase64)
s.done()
