#!/usr/bin/env python3
"""Writes the seed tables of the read-path fuzz target to fuzz/corpus/read/.

Each seed is a small table of one kind the reader meets: the narrow and the
wide header, every dialect's version byte, every field type, deleted records,
a header that promises more records than the file holds, and Visual FoxPro's
extra header room and hidden null-flags column. Run it again after a change;
it rewrites the same files.
"""
import os
import struct

OUT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "corpus", "read")


def table(version, fields, records, count=None, extra=0, end_mark=True, narrow=False, reclen=None):
    """fields: (name, type, length, decimals); records: bytes with flag."""
    reclen = reclen or 1 + sum(f[2] for f in fields)
    n = len(records) if count is None else count
    if narrow:
        out = bytearray(struct.pack("<BHBBBH", version, n, 1, 24, 2, reclen))
        size, length_at, decimals_at = 16, 12, 15
    else:
        hdrlen = 32 + 32 * len(fields) + 1 + extra
        out = bytearray(struct.pack("<BBBBIHH", version, 124, 1, 2, n, hdrlen, reclen)) + bytes(20)
        size, length_at, decimals_at = 32, 16, 17
    for name, typ, length, dec in fields:
        d = bytearray(size)
        d[0:len(name)] = name.encode()
        d[11] = ord(typ)
        d[length_at] = length
        d[decimals_at] = dec
        out += d
    out += b"\x0d"
    if narrow:  # room for 32 descriptors, or the terminator last
        out += bytes((521 if len(fields) <= 32 else 16 * len(fields) + 9) - len(out))
    out += bytes(extra) + b"".join(records)
    return bytes(out + (b"\x1a" if end_mark else b""))


def rec(*parts, live=True):
    return (b" " if live else b"*") + b"".join(parts)


def text(s, n):
    return s.encode("latin-1").ljust(n, b" ")[:n]


PLAIN = [("NAME", "C", 8, 0), ("PRICE", "N", 6, 2), ("RATE", "F", 8, 3), ("BORN", "D", 8, 0), ("OK", "L", 1, 0)]
PLAIN_ROWS = [
    rec(text("alice", 8), text("  1.50", 6), text("   2.125", 8), b"20240229", b"T"),
    rec(text("bob", 8), text(" -3.00", 6), text("       0", 8), b"        ", b"?", live=False),
    rec(text("caf\x82", 8), text("******", 6), text("", 8), b"00000000", b"f"),
]


def seeds():
    yield "dbase3.dbf", table(0x03, PLAIN, PLAIN_ROWS)
    yield "dbase4_memo.dbf", table(0x8B, PLAIN + [("NOTE", "M", 10, 0)],
                                   [r + text("         1", 10) for r in PLAIN_ROWS])
    yield "dbase3_memo.dbf", table(0x83, [("NOTE", "M", 10, 0), ("ID", "N", 3, 0)],
                                   [rec(text("         1", 10), text("  1", 3))])
    yield "foxpro.dbf", table(0xF5, PLAIN + [("PIC", "G", 10, 0)], [r + text("", 10) for r in PLAIN_ROWS])
    yield "clipper_smt.dbf", table(0xE5, [("NOTE", "M", 10, 0)],
                                   [rec(b"\x00\x00" + struct.pack("<II", 12, 1))])
    yield "dbase2.dbf", table(0x02, [("NAME", "C", 4, 0), ("N", "N", 2, 0)],
                              [rec(b"ann ", b" 1"), rec(b"bob ", b" 2", live=False)], narrow=True)
    yield "enable33.dbf", table(0xFE, [("F%d" % i, "C", 1, 0) for i in range(33)], [rec(b"y" * 33)],
                                narrow=True)
    vfp_fields = [("ID", "C", 3, 0), ("QTY", "I", 4, 0), ("PRICE", "Y", 8, 4), ("AT", "T", 8, 0),
                  ("RATE", "B", 8, 0), ("_NullFlags", "0", 1, 0)]
    vfp_rows = [
        rec(b"ab ", struct.pack("<i", -7), struct.pack("<q", 15000), struct.pack("<ii", 2451545, 999),
            struct.pack("<d", 2.25), b"\x00"),
        rec(b"cd ", struct.pack("<i", 123456), struct.pack("<q", -15000), struct.pack("<ii", 0, 0),
            struct.pack("<d", -0.5), b"\x10"),
    ]
    yield "vfp.dbf", table(0x30, vfp_fields, vfp_rows, extra=263)
    yield "count_beyond.dbf", table(0x03, [("ID", "C", 2, 0)], [rec(b"p0"), rec(b"p1")], count=1000,
                                    end_mark=False)
    # Fields of 3 + 4 bytes in records of 1 + 5: the second runs past.
    yield "field_past.dbf", table(0x03, [("A", "C", 3, 0), ("B", "C", 4, 0)], [rec(b"abcde"), rec(b"fghij")],
                                  reclen=6)
    yield "empty.dbf", table(0x03, PLAIN, [], end_mark=False)


def main():
    os.makedirs(OUT, exist_ok=True)
    for name, data in seeds():
        with open(os.path.join(OUT, name), "wb") as f:
            f.write(data)
        print("%-20s %5d bytes" % (name, len(data)))


if __name__ == "__main__":
    main()
