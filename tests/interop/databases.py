"""Shared by the database interop tests: a corpus of tables of every
dialect, with memos where the dialect has them, holding the values that
break careless writers (NULLs, quotes, backslashes, tabs, new lines,
non-ASCII text), and a comparison of a database's rows with zqdb's."""

import decimal
import os

from common import must, zqdb_rows, ZQDB

DIALECTS = [0, 1, 2, 3, 4, 6, 7, 8, 9, 10]

CSV = (
    "NAME,AMOUNT,QTY,BORN,OK,NOTE\n"
    'plain,12.50,3,2024-02-29,true,a short note\n'
    '"quote "" and \\ backslash",-0.25,-7,1999-12-31,false,"tab\there\nnew line"\n'
    "Müller ñ €,,,,,\n"
    ',1000000.01,0,1900-01-01,true,"' + "long memo " * 40 + '"\n'
)
SCHEMA = "NAME C(30), AMOUNT N(12,2), QTY N(6,0), BORN D, OK L, NOTE M"


def make_corpus(d):
    """Writes the corpus CSV and a table of it in every dialect; returns the
    table paths by dialect."""
    src = os.path.join(d, "corpus.csv")
    with open(src, "w", encoding="utf-8") as f:
        f.write(CSV)
    tables = {v: os.path.join(d, "corpus%d.dbf" % v) for v in DIALECTS}
    for v, t in tables.items():
        must([ZQDB, "convert", src, t, "--to", str(v), "--schema", SCHEMA, "--quiet", "--no-progress"])
    return tables


def same(zq, db):
    """zqdb's JSON value equals a database's value (numbers by value,
    logicals as 0/1 or true/false, NULL as None)."""
    if zq is None or db is None:
        return zq is None and db is None
    if isinstance(zq, bool):
        return db in (zq, int(zq))
    if isinstance(zq, (int, decimal.Decimal)) and not isinstance(zq, bool):
        try:
            return decimal.Decimal(str(db)) == decimal.Decimal(zq)
        except decimal.InvalidOperation:
            return False
    return zq == db


def compare(suite, label, table, db_rows, *opts):
    """Every value of zqdb's rows of `table` equals the database's."""
    zrows = zqdb_rows(table, *opts)
    suite.check(label + " row count", len(zrows) == len(db_rows), "zqdb %d, database %d" % (len(zrows), len(db_rows)))
    bad = []
    for i, (z, r) in enumerate(zip(zrows, db_rows)):
        lower = {k.lower(): v for k, v in r.items()}
        for k, v in z.items():
            if not same(v, lower.get(k.lower(), "<missing>")):
                bad.append("row %d %s: zqdb %r, database %r" % (i, k, v, lower.get(k.lower(), "<missing>")))
    suite.check(label + " values", not bad, "; ".join(bad[:6]))
