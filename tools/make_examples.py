#!/usr/bin/python3
"""Makes the bundled example table examples/customers.dbf: a dBASE III+ table
of 20 customers (text, number, date and logical fields), one of them deleted,
with accented names in code page 850. Standard library only; the output is the
same byte for byte on every run.

    tools/make_examples.py [OUT_DIR]     (default: examples/ beside tools/)
"""

import os
import struct
import sys

# Field descriptors: name, type letter, width, decimals.
FIELDS = [
    ("ID", "N", 4, 0),
    ("NAME", "C", 24, 0),
    ("CITY", "C", 16, 0),
    ("COUNTRY", "C", 2, 0),
    ("JOINED", "D", 8, 0),
    ("BALANCE", "N", 10, 2),
    ("ACTIVE", "L", 1, 0),
]

# deleted, id, name, city, country, joined (YYYYMMDD or ""), balance (or None), active ("T", "F", "?")
CUSTOMERS = [
    (0, 1, "Ana María Gómez", "Sevilla", "ES", "19980314", 1250.00, "T"),
    (0, 2, "Björn Åkesson", "Malmö", "SE", "20010702", -75.50, "T"),
    (0, 3, "Chloé Lefèvre", "Besançon", "FR", "20050119", 0.00, "F"),
    (0, 4, "Dieter Müller", "Köln", "DE", "19991231", 98765.43, "T"),
    (0, 5, "Émile Durand", "Orléans", "FR", "20100901", 310.25, "T"),
    (0, 6, "Fatma Yılmaz", "Izmir", "TR", "20150415", 42.00, "?"),
    (0, 7, "Giulia Rossi", "Forlì", "IT", "20000229", 1999.99, "T"),
    (0, 8, "Hans Jørgensen", "Århus", "DK", "19950610", -1200.00, "F"),
    (0, 9, "Inês Conceição", "Coimbra", "PT", "20120808", 560.80, "T"),
    (0, 10, "João Gonçalves", "Évora", "PT", "", None, "?"),
    (1, 11, "Karl Deleted", "Nowhere", "XX", "20200101", 0.00, "F"),
    (0, 12, "Lucía Fernández", "Málaga", "ES", "20180303", 77.70, "T"),
    (0, 13, "Mia Schäfer", "Zürich", "CH", "20070707", 15000.00, "T"),
    (0, 14, "Niels Ødegaard", "Tromsø", "NO", "20030330", 3.14, "F"),
    (0, 15, "O'Brien, Seán", "Dublin", "IE", "19890101", 250.00, "T"),
    (0, 16, "Pál Szabó", "Pécs", "HU", "20161111", -9.99, "T"),
    (0, 17, "Renée \"Kiki\" Blanc", "Nîmes", "FR", "20090404", 1000.00, "F"),
    (0, 18, "Sofía Peña", "Cádiz", "ES", "20210921", 88.88, "T"),
    (0, 19, "Ólafur Jónsson", "Reykjavík", "IS", "20141225", 600.00, "T"),
    (0, 20, "Ümit Öztürk", "Ankara", "TR", "20220606", 12.34, "T"),
]

# Header (all numbers little-endian):
#   OFFSET SIZE  FIELD
#      0     1   version byte: 0x03, dBASE III+ without memo
#      1     3   date of last change: year - 1900, month, day
#      4     4   record count
#      8     2   header length: 32 + 32 * fields + 1
#     10     2   record length: 1 + field widths
#     29     1   language driver: 0x02, code page 850
# Field descriptor (32 bytes): name (11, zero-filled), type (1), 4 zero,
# width (1), decimals (1), 14 zero.
VERSION, LDID_850 = 0x03, 0x02
HDR_DATE, HDR_COUNT, HDR_LENGTHS, HDR_LDID = 1, 4, 8, 29
DESC_TYPE, DESC_WIDTH, DESC_DECIMALS = 11, 16, 17
CHANGED = (124, 1, 15)  # 2024-01-15, fixed so that the file never changes


def encode(text, width):
    """Text in code page 850, padded with blanks. A character that cp850
    lacks stops the script rather than turn into '?'."""
    data = text.encode("cp850")
    if len(data) > width:
        raise ValueError("%r is wider than %d" % (text, width))
    return data.ljust(width)


def record(row):
    deleted, ident, name, city, country, joined, balance, active = row
    values = [
        b"%4d" % ident,
        encode(name, 24),
        encode(city, 16),
        encode(country, 2),
        joined.encode("ascii").ljust(8),
        b"%10.2f" % balance if balance is not None else b" " * 10,
        active.encode("ascii"),
    ]
    for value, (_, _, width, _) in zip(values, FIELDS):
        assert len(value) == width
    return (b"*" if deleted else b" ") + b"".join(values)


def table():
    header_len = 32 + 32 * len(FIELDS) + 1
    record_len = 1 + sum(f[2] for f in FIELDS)
    head = bytearray(32)
    head[0] = VERSION
    head[HDR_DATE:HDR_DATE + 3] = bytes(CHANGED)
    struct.pack_into("<I", head, HDR_COUNT, len(CUSTOMERS))
    struct.pack_into("<HH", head, HDR_LENGTHS, header_len, record_len)
    head[HDR_LDID] = LDID_850
    for name, letter, width, decimals in FIELDS:
        desc = bytearray(32)
        desc[0:len(name)] = name.encode("ascii")
        desc[DESC_TYPE] = ord(letter)
        desc[DESC_WIDTH] = width
        desc[DESC_DECIMALS] = decimals
        head += desc
    head += b"\x0d"
    body = b"".join(record(r) for r in CUSTOMERS)
    return bytes(head) + body + b"\x1a"


def main():
    out_dir = sys.argv[1] if len(sys.argv) > 1 else os.path.join(os.path.dirname(os.path.abspath(__file__)),
                                                                  "..", "examples")
    os.makedirs(out_dir, exist_ok=True)
    path = os.path.join(out_dir, "customers.dbf")
    with open(path, "wb") as f:
        f.write(table())
    print("wrote %s (%d records, %d live)" % (os.path.normpath(path), len(CUSTOMERS),
                                              sum(1 for r in CUSTOMERS if not r[0])))


if __name__ == "__main__":
    main()
