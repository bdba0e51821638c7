"""Shared helpers of the index interop tests: keys drawn at random with long
runs of equal keys, `zqdb keys` and Perl XBase's walk and seek of one index,
and the check that both agree with the records."""

import json
import os
import subprocess

from common import must, run, write_csv, ZQDB

# Walks an index (argv: file, tag or "", form) and prints "W key recno" per
# key, then seeks each key read from stdin and prints "S key recno" for the
# key found there; "-" for none. Keys lose their trailing blanks; with the
# form "hex" keys are read and printed as the hex of their bytes. A CDX file
# holds no key type, so its tags are opened as character keys.
PERL = r'''
use strict; use XBase::Index;
my ($file, $tag, $form) = @ARGV;
my $hex = ($form // "") eq "hex";
my @opts = length $tag ? (tag => $tag) : ();
push @opts, (type => "C") if $file =~ /\.cdx$/i;
my $ix = XBase::Index->new($file, @opts) or die XBase::Index->errstr;
sub show { my $k = shift; return "-" unless defined $k;
           return unpack("H*", $k) if $hex; $k =~ s/ +$//; $k }
$ix->prepare_select;
while (my ($k, $r) = $ix->fetch) { print "W\t", show($k), "\t$r\n" }
while (my $k = <STDIN>) {
    chomp $k;
    $k = pack("H*", $k) if $hex;
    $ix->prepare_select_eq($k) or die $ix->errstr;
    my ($f, $r) = $ix->fetch;
    print "S\t", show($f), "\t", $r // 0, "\n";
}
'''

ALPHABET = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789 -./"


def key_pool(rng, width, distinct):
    """`distinct` keys of up to `width` bytes, without leading or trailing
    blanks, many sharing a long prefix so that they differ late."""
    stems = ["".join(rng.choice(ALPHABET) for _ in range(width * 2 // 3)).strip() for _ in range(3)]
    pool = {""}  # a blank key sorts first
    while len(pool) < distinct:
        tail = "".join(rng.choice(ALPHABET) for _ in range(rng.randrange(1, width // 3 + 2)))
        pool.add((rng.choice(stems + [""]) + tail)[:width].strip())
    return sorted(pool)


def draw(rng, pool, n):
    """n keys from the pool in random order; a tenth of them one key, so that
    runs of equal keys span several nodes."""
    common = pool[len(pool) // 2]
    return [common if rng.random() < 0.1 else rng.choice(pool) for _ in range(n)]


STATUS = ["open", "closed", "held", "void", ""]


def status(recno):
    """Field G of record `recno`: a few values in long runs."""
    return STATUS[recno * 7 % len(STATUS)]


def write_keys(path, keys, first_id):
    """A CSV file of ID, K (the keys) and G, IDs counted from `first_id`."""
    write_csv(path, ("ID", "K", "G"), [(first_id + i, k, status(first_id + i)) for i, k in enumerate(keys)])


def tags_hold(s, label, table, index, recs):
    """Tags K and G of `index` hold one key per record of `recs` (recno -> key)."""
    check_index(s, label + " K", table, index, "K", [(k, r) for r, k in recs.items()])
    check_index(s, label + " G", table, index, "G", [(status(r), r) for r in recs])


def append_keys(s, d, label, table, index, keys, recs):
    """Records of `keys` added by --mode append (no index option) go into
    tags K and G of `index`; `recs` takes them."""
    first, csv = len(recs) + 1, os.path.join(d, "more.csv")
    write_keys(csv, keys, first)
    must([ZQDB, "convert", csv, table, "--mode", "append", "--no-progress"])
    recs.update(enumerate(keys, first))
    tags_hold(s, label, table, index, recs)


def convert(d, name, keys, *opts):
    """The table `name`.dbf in d of the keys, made by zqdb convert with `opts`."""
    csv, table = os.path.join(d, name + ".csv"), os.path.join(d, name + ".dbf")
    write_keys(csv, keys, 1)
    must([ZQDB, "convert", csv, table, "--no-progress", *opts])
    return table


def zq_keys(table, index, *opts):
    out = must([ZQDB, "keys", table, "--index", index, "--format", "jsonl", *opts])
    return [(r["key"], r["recno"]) for r in map(json.loads, out.splitlines())]


def perl_walk(index, tag="", seek=(), form=""):
    """(walk, seeks) as Perl XBase reads them: lists of (key, recno)."""
    p = subprocess.run(["perl", "-e", PERL, index, tag, form], input="".join(k + "\n" for k in seek).encode(),
                       capture_output=True, timeout=120)
    if p.returncode != 0:
        raise AssertionError("perl: " + p.stderr.decode(errors="replace")[-400:])
    walk, found = [], []
    for line in p.stdout.decode("latin-1").splitlines():
        kind, key, recno = line.split("\t")
        (walk if kind == "W" else found).append((key, int(recno)))
    return walk, found


def first_records(walk):
    """The first record number of each distinct key of a walk."""
    first = {}
    for k, r in walk:
        first.setdefault(k, r)
    return first


def first_difference(a, b):
    return next((i for i, (x, y) in enumerate(zip(a, b)) if x != y), min(len(a), len(b)))


def check_index(s, label, table, index, tag, entries, *zq_opts):
    """zqdb's walk holds `entries` ((key, recno) pairs) in key order; Perl walks it alike and its seek finds each
    distinct key's first record. Perl walks part of a tree without an error
    when a header names an old root, so the counts are checked too."""
    zq = zq_keys(table, tag or index, *zq_opts)
    want = sorted(entries)
    s.check(label + " zqdb key order", [k for k, _ in zq] == [k for k, _ in want])
    s.check(label + " zqdb records", sorted(zq) == want, "%d keys, %d expected; first difference at %d" % (
        len(zq), len(want), first_difference(sorted(zq), want)))
    first = first_records(zq)
    walk, found = perl_walk(index, tag or "", seek=list(first))
    s.check(label + " Perl walk", walk == zq, "%d keys from Perl, %d from zqdb; first difference at %d" % (
        len(walk), len(zq), first_difference(walk, zq)))
    bad = [(k, r, f) for (k, r), f in zip(first.items(), found) if f != (k, r)]
    s.check(label + " Perl seek", len(found) == len(first) and not bad, "%d of %d seeks wrong: %s" % (
        len(bad), len(first), bad[:3]))


# A key no other key of a stale test shares a prefix with, so that every
# index kind stores it whole; it sorts last, and stays last when its last
# byte changes.
MARKER = "~marker"


def stale_table(d, name, n, *opts):
    """A table of n records over ID, K and G, with K the marker in record
    n // 2; returns (table, {recno: key})."""
    keys = {r: ("k%02d" % (r * 7 % n) if r != n // 2 else MARKER) for r in range(1, n + 1)}
    csv, table = os.path.join(d, name + ".csv"), os.path.join(d, name + ".dbf")
    write_csv(csv, ("ID", "K", "G"), [(r, k, "g") for r, k in keys.items()])
    must([ZQDB, "convert", csv, table, "--no-progress", "--schema", "ID N(7), K C(10), G C(6)", *opts])
    return table, keys


def stale_and_mended(s, label, table, keys, tag_file, tag, other, appended):
    """Records that another program appended (`appended`, recno -> key) and
    the marker's last byte changed in the tag's file and in `other`, an
    index file named with --index: check names both faults in both, reindex
    rebuilds them, check is clean, and Perl walks each as zqdb does, one key
    per record."""
    for index in (tag_file, other):
        with open(index, "r+b") as f:
            data = f.read()
            f.seek(data.rindex(MARKER.encode()) + len(MARKER) - 1)
            f.write(b"s")
    rc, out, err = run([ZQDB, "check", table, "--index", other])
    for part in (tag, other):
        for finding in ("has no key in the index", "differs from '%s'" % MARKER):
            s.check("%s %s finds %s" % (label, part, finding), rc == 1 and any(
                line.startswith("index %s: record" % part) and finding in line for line in out.splitlines()),
                "exit %d: %s" % (rc, out[-300:] + err))
    must([ZQDB, "reindex", table, "--index", tag, "--index", other])
    s.check_clean(label + " reindexed", table, "--index", other)
    keys = {**keys, **appended}
    for index, t in ((tag_file, tag), (other, None)):
        check_index(s, "%s reindexed %s" % (label, t or "file"), table, index, t, [(k, r) for r, k in keys.items()])
