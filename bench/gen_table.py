#!/usr/bin/python3
"""Writes a dBASE III table of N records, 140 bytes each, 1% of them deleted,
for the benchmarks:

    gen_table.py OUT.dbf N

Fields: ID N(8), NAME C(30), CITY C(20), BORN D, AMOUNT N(12,2), ACTIVE L,
NOTE C(50), QTY N(6), CODE C(4). Values vary record by record and repeat on
no short cycle that a reader could cache. Standard library only.
"""

import struct
import sys

FIELDS = [("ID", b"N", 8, 0), ("NAME", b"C", 30, 0), ("CITY", b"C", 20, 0), ("BORN", b"D", 8, 0),
          ("AMOUNT", b"N", 12, 2), ("ACTIVE", b"L", 1, 0), ("NOTE", b"C", 50, 0), ("QTY", b"N", 6, 0),
          ("CODE", b"C", 4, 0)]
RECORD_LEN = 1 + sum(f[2] for f in FIELDS)  # 140
HEADER_LEN = 32 + 32 * len(FIELDS) + 1

FIRST = [b"Anna", b"Bernd", b"Chlo\xe9", b"Dmitri", b"Elif", b"Franz", b"Greta", b"Hiro", b"Ines", b"Jonas",
         b"Kaja", b"Lars", b"Mia", b"Noah", b"Olga", b"Pablo", b"Quinn", b"Rosa", b"Sven", b"Tanja"]
LAST = [b"M\xfcller", b"Schmidt", b"Garc\xeda", b"Rossi", b"Novak", b"Dubois", b"Jensen", b"Kowalski",
        b"Silva", b"Nakamura", b"O'Brien", b"Smith, Jr.", b"Van Dyke", b"Larsen", b"Petrov", b"Weber",
        b"Fischer", b"Kaya", b"Horvat", b"Lindqvist", b"Costa", b"Bauer", b"Meyer"]
CITIES = [b"Aarhus", b"Berlin", b"C\xf3rdoba", b"Dublin", b"Espoo", b"Florence", b"Graz", b"Hamburg",
          b"Istanbul", b"Jena", b"K\xf6ln", b"Lisbon", b"Malm\xf6", b"Nantes", b"Oslo", b"Porto", b"Quito",
          b"Riga", b"Sevilla", b"Turku", b"Utrecht", b"Vienna", b"Warsaw", b"Zurich", b""]
NOTES = [b"", b"call back after the holidays", b"prefers email", b"VIP customer since 1998",
         b"address changed, see \"new\" record", b"paid in advance", b"", b"no newsletter, please",
         b"order pending; needs approval from the branch office", b"duplicate of an older entry?", b""]


def header(count, fields=FIELDS, version=0x03):
    """The wide header of a table of `count` records with `fields`
    (name, type letter, width, decimals), ended by 0x0D."""
    h = bytearray(32)
    h[0] = version
    h[1:4] = bytes([124, 1, 1])
    struct.pack_into("<IHH", h, 4, count, 32 + 32 * len(fields) + 1, 1 + sum(f[2] for f in fields))
    for name, letter, length, dec in fields:
        d = bytearray(32)
        d[0:len(name)] = name.encode()
        d[11:12] = letter
        d[16] = length
        d[17] = dec
        h += d
    h += b"\x0d"
    return bytes(h)


def names():
    # 460 full names, each padded to 30 bytes.
    return [(f + b" " + l).ljust(30)[:30] for l in LAST for f in FIRST]


def main():
    out, n = sys.argv[1], int(sys.argv[2])
    full = names()
    cities = [c.ljust(20) for c in CITIES]
    notes = [x.ljust(50)[:50] for x in NOTES]
    dates = [b"%04d%02d%02d" % (1940 + y, m, d) for y in range(60) for m in (1, 4, 7, 10, 12) for d in (1, 15, 28)]
    dates += [b"        "]
    codes = [(b"%c%c%02d" % (65 + i % 26, 65 + (i // 26) % 26, i % 97)) for i in range(677)]
    chunk = []
    with open(out, "wb") as f:
        f.write(header(n))
        for i in range(n):
            flag = b"*" if i % 100 == 37 else b" "
            cents = (i * 7919) % 10000000 - 2000000
            chunk.append(b"%s%8d%s%s%s%12.2f%s%s%6d%s" % (
                flag, i + 1, full[i % 460], cities[i % 25], dates[i % 901], cents / 100,
                b"TF?"[i % 3:i % 3 + 1], notes[i % 11], (i * 31) % 1000000 - 99999 if i % 3 else i % 1000,
                codes[i % 677]))
            if len(chunk) == 65536:
                f.write(b"".join(chunk))
                chunk.clear()
        f.write(b"".join(chunk))
        f.write(b"\x1a")


if __name__ == "__main__":
    main()
