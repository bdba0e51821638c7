"""Shared helpers of the interop tests.

Each test script writes tables with an independent program (python3-dbf,
Perl XBase, shapelib, GDAL), reads them back through `zqdb cat --format jsonl`
and through python3-dbfread, and checks that both readers see the same fields
and the same live records, value for value. Run as

    /usr/bin/python3 test_x.py PATH_TO_ZQDB

The Debian modules (dbf, dbfread) live in the system Python only.
"""

import contextlib
import datetime
import decimal
import json
import math
import os
import subprocess
import sys
import tempfile

import dbfread

ZQDB = os.path.abspath(sys.argv[1]) if len(sys.argv) > 1 else "zqdb"


def run(cmd, **kw):
    """Runs a command; returns (exit status, stdout text, stderr text)."""
    p = subprocess.run(cmd, capture_output=True, timeout=60, **kw)
    return p.returncode, p.stdout.decode("utf-8", "replace"), p.stderr.decode("utf-8", "replace")


def must(cmd):
    """Runs a command; returns its stdout, or raises with its error when it fails."""
    rc, out, err = run(cmd)
    if rc != 0:
        raise AssertionError("%s: exit %d: %s" % (os.path.basename(cmd[0]), rc, err.strip()[-400:]))
    return out


def zqdb_rows(table, *opts):
    """The live records as zqdb prints them in JSON lines, numbers as Decimal."""
    out = must([ZQDB, "cat", table, "--format", "jsonl", *opts])
    return [json.loads(line, parse_float=decimal.Decimal) for line in out.splitlines()]


def zqdb_fields(table, *opts):
    """(name, type letter, width, decimals) of each field from `zqdb info`."""
    fields, in_list = [], False
    for line in must([ZQDB, "info", table, *opts]).splitlines():
        if line.strip().startswith("#") and "name" in line:
            in_list = True
            continue
        if in_list:
            if not line.startswith("  "):
                break  # the index list behind the fields
            num, name, letter, width, dec = line.split()
            fields.append((name, letter, int(width), int(dec)))
    return fields


def dbfread_table(table, encoding="ascii"):
    return dbfread.DBF(table, encoding=encoding, char_decode_errors="strict", load=False,
                        ignore_missing_memofile=True)


def dbfread_fields(table, encoding="ascii"):
    t = dbfread_table(table, encoding)
    return [(f.name, f.type, f.length, f.decimal_count) for f in t.fields]


def dbfread_rows(table, encoding="ascii"):
    return [dict(r) for r in dbfread_table(table, encoding)]


# --- value comparison --------------------------------------------------------

def same_number(zq, ref):
    """Integers exactly, other numbers to 12 digits; no value, text or a
    logical only equal to no value."""
    if zq is None or ref is None or isinstance(zq, (str, bool)) or isinstance(ref, bool):
        return zq is None and ref is None
    if isinstance(zq, int) and isinstance(ref, int):
        return zq == ref
    return math.isclose(float(zq), float(ref), rel_tol=1e-12, abs_tol=1e-9)


def datetime_as_zqdb(ref):
    """zqdb shows a date-time to the second: the millisecond count plus one,
    divided by 1000 in integers (so 999 ms rounds up, 998 ms down)."""
    if ref is None:
        return None
    rounded = datetime.timedelta(seconds=(ref.microsecond // 1000 + 1) // 1000)
    return (ref.replace(microsecond=0) + rounded).isoformat()


def same_value(letter, zq, ref):
    """True when zqdb's JSON value `zq` equals dbfread's `ref` for a field of
    type `letter` (for B: the dialect-10 double)."""
    if letter in "NFIYB":
        return same_number(zq, ref)
    if letter == "D":
        return zq == (ref.isoformat() if ref is not None else None)
    if letter == "T":
        return zq == datetime_as_zqdb(ref)
    if letter == "L":
        return zq is ref
    if letter == "M":  # no memo and an empty one are the same to both readers
        return (zq or None) == (ref or None)
    return zq == ref


# --- tables written from CSV, read back by every reader ----------------------

def write_csv(path, names, rows):
    """Writes `rows` (tuples in the order of `names`) as CSV with a header:
    booleans as true/false, dates and date-times in ISO form, None empty."""
    def cell(v):
        if v is None:
            return ""
        if isinstance(v, bool):
            return "true" if v else "false"
        t = v.isoformat() if isinstance(v, (datetime.date, datetime.datetime)) else \
            format(v, "f") if isinstance(v, decimal.Decimal) else str(v)
        return '"' + t.replace('"', '""') + '"' if any(c in t for c in ',"\r\n') else t
    with open(path, "w", encoding="utf-8", newline="") as f:
        f.write("\r\n".join([",".join(names)] + [",".join(cell(v) for v in r) for r in rows]) + "\r\n")


def same_written(want, got):
    """A value as written against one read back by any reader: blank text, a
    blank memo and no value are one; numbers by value; dates and date-times
    as objects or as zqdb's ISO text."""
    if want in (None, "") or got in (None, ""):
        return want in (None, "") and got in (None, "")
    if isinstance(want, bool) or isinstance(got, bool):
        return want is got
    if isinstance(want, (int, float, decimal.Decimal)):
        return isinstance(got, (int, float, decimal.Decimal)) and \
            abs(decimal.Decimal(str(got)) - decimal.Decimal(str(want))) <= abs(decimal.Decimal(str(want))) * decimal.Decimal("1e-12")
    if isinstance(want, (datetime.date, datetime.datetime)):
        return got == want or got == want.isoformat()
    return got == want


def compare_rows(s, label, names, want_rows, got_rows, skip=()):
    """`got_rows` (dicts by field name) hold `want_rows` (tuples in the order
    of `names`), field for field but those in `skip`."""
    s.check(label + " record count", len(got_rows) == len(want_rows), "%d, expected %d" % (len(got_rows), len(want_rows)))
    bad = ["record %d %s: %r, expected %r" % (i, k, g.get(k), v)
           for i, (w, g) in enumerate(zip(want_rows, got_rows)) for k, v in zip(names, w)
           if k not in skip and not same_written(v, g.get(k))]
    s.check(label + " values", not bad, "; ".join(bad[:4]))


def pydbf_rows(path, codepage="cp1252"):
    """The records as python3-dbf reads them, names upper-cased, text without
    trailing blanks; a memo up to its first 0x1A (python3-dbf reads a dBASE
    III memo on to a pair of them), ten digits 0 (on which it fails) as None."""
    import dbf
    with dbf.Table(path, codepage=codepage) as t:
        rows = []
        for rec in t:
            row = {}
            for name in t.field_names:
                try:
                    v = rec[name]
                except TypeError:
                    v = None
                row[name.upper()] = v.split("\x1a")[0].rstrip(" ") if isinstance(v, str) else v
            rows.append(row)
        return rows


class Suite:
    """A group of named checks; prints one line per failure and a summary."""

    def __init__(self, name):
        self.name = name
        self.passed = self.failed = 0

    def check(self, label, ok, detail=""):
        if ok:
            self.passed += 1
        else:
            self.failed += 1
            print("FAIL %s: %s%s" % (self.name, label, (": " + detail) if detail else ""))
        return ok

    @contextlib.contextmanager
    def case(self, label):
        """Runs a block as one check; an exception fails that check only."""
        try:
            yield
        except Exception as e:  # noqa: BLE001 - any failure of the block is reported
            self.check(label, False, "%s: %s" % (type(e).__name__, e))

    def compare_table(self, label, table, zq_opts=(), encoding="ascii", ref_fix=None, expect_live=None):
        """zqdb and dbfread agree on the fields and on every live record of
        `table`. `ref_fix(field_name, value)` corrects a known quirk of dbfread
        before comparing. Returns zqdb's rows."""
        with self.case(label):
            zf = zqdb_fields(table, *zq_opts)
            rf = dbfread_fields(table, encoding)
            self.check(label + " fields", zf == rf, "zqdb %s, dbfread %s" % (zf, rf))
            zrows = zqdb_rows(table, *zq_opts)
            rrows = dbfread_rows(table, encoding)
            if ref_fix:
                rrows = [{k: ref_fix(k, v) for k, v in r.items()} for r in rrows]
            if expect_live is not None:
                self.check(label + " live count", len(zrows) == expect_live,
                           "zqdb %d, expected %d" % (len(zrows), expect_live))
            self.check(label + " record count", len(zrows) == len(rrows),
                       "zqdb %d, dbfread %d" % (len(zrows), len(rrows)))
            letters = {f[0]: f[1] for f in rf}
            bad = ["record %d %s: zqdb %r, dbfread %r" % (i, k, z.get(k, "<none>"), r[k])
                   for i, (z, r) in enumerate(zip(zrows, rrows)) for k in r
                   if list(z) != list(r) or not same_value(letters[k], z[k], r[k])]
            self.check(label + " values", not bad, "; ".join(bad[:8]) + (" ..." if len(bad) > 8 else ""))
            return zrows
        return []

    def check_clean(self, label, table, *opts, finds=None):
        """`zqdb check` finds nothing in `table`, its memo file and its
        indexes: exit 0 and one line, the summary that says clean (stderr
        may tell how the table is read). With `finds`: exit 1 and a finding
        that holds that text."""
        rc, out, err = run([ZQDB, "check", table, *opts])
        lines = out.splitlines()
        if finds is None:
            ok = rc == 0 and len(lines) == 1 and ": clean (" in lines[0]
        else:
            ok = rc == 1 and any(finds in line for line in lines[:-1])
        return self.check(label + (" check clean" if finds is None else " check finds " + finds), ok,
                          "exit %d: %s %s" % (rc, " | ".join(lines[:6]), err.strip()[-300:]))

    def done(self):
        print("%s: %d passed, %d failed" % (self.name, self.passed, self.failed))
        sys.exit(1 if self.failed else 0)


@contextlib.contextmanager
def workdir():
    """A temporary directory, removed afterwards; yields its path."""
    with tempfile.TemporaryDirectory(prefix="zqdb-interop-") as d:
        yield d
