"""Tables written by shapelib (dbfcreate, dbfadd) and by GDAL (ogr2ogr from
CSV), read alike by zqdb and dbfread. Both write a null number as asterisks
over its whole width, and GDAL a null date as 00000000: zqdb reads each as
null, as dbfread does."""

import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, must, workdir  # noqa: E402

s = Suite("shapelib_gdal")


with workdir() as d:
    # shapelib: dbfadd stores the text bytes it is given (UTF-8 here) and
    # keeps leading blanks, in a table it marks as code page 1252 (language
    # driver 0x57) all the same: the text is read as UTF-8 by --codepage.
    shp = os.path.join(d, "shape.dbf")
    with s.case("shapelib write"):
        must(["dbfcreate", shp, "-s", "NAME", "24", "-n", "QTY", "6", "0", "-n", "PRICE", "12", "3",
              "-s", "CODE", "3"])
        for row in (["  lead", "12", "3.25", "A"], ["Müller, \"Zoë\"", "-4", "-0.5", "B"],
                    ["東京", "0", "0", ""], ["x" * 24, "999999", "99999999.999", "xyz"], ["", "", "", ""]):
            must(["dbfadd", shp] + row)
    rows = s.compare_table("shapelib", shp, ["--codepage", "utf-8"], "utf-8", expect_live=5)
    s.check_clean("shapelib", shp)
    if rows:
        s.check("shapelib leading blanks kept", rows[0]["NAME"] == "  lead", repr(rows[0]["NAME"]))
        s.check("shapelib UTF-8 text", rows[1]["NAME"] == "Müller, \"Zoë\"" and rows[2]["NAME"] == "東京",
                repr([r["NAME"] for r in rows]))

    # shapelib writes 300 fields under the version byte 0x03, more than dBASE
    # IV reads: zqdb reads them all (as Visual dBASE 5.5), as dbfread does.
    wide = os.path.join(d, "wide.dbf")
    with s.case("shapelib 300 fields"):
        args = []
        for i in range(1, 301):
            args += ["-s", "F%d" % i, "2"]
        must(["dbfcreate", wide] + args)
        must(["dbfadd", wide] + ["v%d" % (i % 10) for i in range(1, 301)])
    s.compare_table("shapelib 300 fields", wide, [], "ascii", expect_live=1)
    s.check_clean("shapelib 300 fields", wide)

    # GDAL: CSV to DBF with type detection (integer, real and date columns)
    # and the text in code page 1252.
    csv = os.path.join(d, "in.csv")
    with open(csv, "w", encoding="utf-8") as f:
        f.write("id,name,amount,born,city\n"
                "1,  Zoë,12.5,2001-02-03,Århus\n"
                "2,\"a, \"\"q\"\"\",-3,1999-12-31,Köln\n"
                "3,Ærø ,1e3,1970-01-01,\n"
                "4,€ 5,0.001,2024-02-29,São Paulo\n"
                ",,,,\n")
    gdal = os.path.join(d, "gdal.dbf")
    with s.case("ogr2ogr typed"):
        must(["ogr2ogr", "-f", "ESRI Shapefile", "-oo", "AUTODETECT_TYPE=YES", "-lco", "ENCODING=CP1252",
              gdal, csv])
    rows = s.compare_table("GDAL typed cp1252", gdal, ["--codepage", "1252"], "cp1252", expect_live=5)
    s.check_clean("GDAL typed", gdal)
    if rows:
        s.check("GDAL text", [r["city"] for r in rows] == ["Århus", "Köln", "", "São Paulo", ""],
                repr([r["city"] for r in rows]))
        s.check("GDAL dates and nulls", rows[3]["born"] == "2024-02-29"
                and rows[4]["id"] is None is rows[4]["born"] and rows[4]["amount"] is None, repr(rows[3:]))

    # Without type detection every column is text, 80 wide. The code page of
    # GDAL's tables is in their .cpg file (CP1252, CP850, UTF-8), their
    # language driver byte 0: zqdb finds it without --codepage.
    for enc in ("CP1252", "CP850", "UTF-8"):
        path = os.path.join(d, "cpg_%s.dbf" % enc.replace("-", ""))
        with s.case("ogr2ogr " + enc):
            must(["ogr2ogr", "-f", "ESRI Shapefile", "-lco", "ENCODING=" + enc, path, csv])
        s.compare_table("GDAL %s by its .cpg" % enc, path, [], enc.lower(), expect_live=5)
        s.check_clean("GDAL " + enc, path)

s.done()
