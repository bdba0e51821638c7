"""Tables of every dialect, with memos, converted to SQLite and read back
with Debian's sqlite3: every value equals what zqdb cat --format jsonl
gives. Then append mode, and the database as a source of a new table."""

import json
import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import ZQDB, Suite, must, run, workdir, write_csv  # noqa: E402
from databases import DIALECTS, compare, make_corpus  # noqa: E402

s = Suite("sqlite")


def sqlite_rows(db, table):
    out = must(["sqlite3", "-json", db, 'SELECT * FROM "%s" ORDER BY rowid' % table])
    return json.loads(out) if out.strip() else []


def sqlite_types(db, table):
    out = must(["sqlite3", db, 'SELECT name, type FROM pragma_table_info("%s")' % table])
    return dict(line.split("|") for line in out.splitlines())


with workdir() as d:
    tables = make_corpus(d)
    for v in DIALECTS:
        with s.case("dialect %d" % v):
            db = os.path.join(d, "corpus%d.sqlite" % v)
            must([ZQDB, "convert", tables[v], db, "--no-progress"])
            compare(s, "dialect %d" % v, tables[v], sqlite_rows(db, "corpus%d" % v))
    with s.case("column types"):
        types = sqlite_types(os.path.join(d, "corpus2.sqlite"), "corpus2")
        want = {"NAME": "TEXT", "AMOUNT": "REAL", "QTY": "INTEGER", "BORN": "TEXT", "OK": "INTEGER", "NOTE": "TEXT"}
        s.check("column types", types == want, repr(types))
    with s.case("append and --table"):
        db = os.path.join(d, "shop.sqlite")
        for mode in ("replace", "append"):
            must([ZQDB, "convert", tables[2], db, "--table", "people", "--mode", mode, "--no-progress"])
        rows = sqlite_rows(db, "people")
        s.check("append doubles the rows", len(rows) == 8, "%d rows" % len(rows))
    with s.case("SQLite as a source"):
        back = os.path.join(d, "back.dbf")
        must([ZQDB, "convert", os.path.join(d, "shop.sqlite"), back, "--table", "people", "--no-progress"])
        compare(s, "SQLite source", back, sqlite_rows(os.path.join(d, "shop.sqlite"), "people"))
    with s.case("rows by the statement: whole statements and the rest, new and appended"):
        # 75 rows: two statements of 32 rows and one of 11, into a new
        # database and again into the same table.
        many = os.path.join(d, "many.csv")
        write_csv(many, ("ID", "NAME", "AMOUNT"),
                  [(i, 'row %d "q" \\' % i, "" if i % 7 == 0 else "%d.25" % i) for i in range(75)])
        table = os.path.join(d, "many.dbf")
        must([ZQDB, "convert", many, table, "--no-progress"])
        db = os.path.join(d, "many.sqlite")
        for mode in ("replace", "append"):
            must([ZQDB, "convert", table, db, "--mode", mode, "--no-progress"])
        rows = sqlite_rows(db, "many")
        compare(s, "many rows, first run", table, rows[:75])
        compare(s, "many rows, appended", table, rows[75:])
    with s.case("a failed run leaves no new database behind"):
        bad = os.path.join(d, "bad.csv")
        with open(bad, "w") as f:
            f.write("NAME,QTY\nx,1\ny,not a number\n")
        new = os.path.join(d, "new.sqlite")
        rc, _, _ = run([ZQDB, "convert", bad, new, "--schema", "QTY N(6,0)", "--no-progress"])
        left = [n for n in os.listdir(d) if n.startswith("new.sqlite")]
        s.check("failed run left nothing", rc == 1 and not left, "exit %d, left %r" % (rc, left))
    with s.case("a failed append leaves the database as it was"):
        rc, _, _ = run([ZQDB, "convert", bad, os.path.join(d, "shop.sqlite"), "--table", "people", "--mode", "append",
                        "--schema", "QTY N(6,0)", "--no-progress"])
        rows = sqlite_rows(os.path.join(d, "shop.sqlite"), "people")
        s.check("failed append rolled back", rc == 1 and len(rows) == 8, "exit %d, %d rows" % (rc, len(rows)))

s.done()
