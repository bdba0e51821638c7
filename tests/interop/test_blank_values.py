"""Empty values as other programs write them: blanks, asterisk-filled numbers
(shapelib and GDAL write a null number so), 00000000 dates (GDAL), "?"
logicals and zero-filled binary fields (python3-dbf's Visual FoxPro). zqdb
reads each as null, as dbfread does."""

import os
import sys

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, must, workdir  # noqa: E402

import dbf  # noqa: E402

s = Suite("blank_values")


with workdir() as d:
    # python3-dbf, dBASE III: blanks everywhere, "?" in the logical.
    db3 = os.path.join(d, "blank3.dbf")
    t = dbf.Table(db3, "N N(5,1); D D; L L; C C(3)", dbf_type="db3")
    t.open(dbf.READ_WRITE)
    t.append((None, None, None, None))
    t.append((1.5, None, True, "a"))
    t.close()
    rows = s.compare_table("dBASE III blanks", db3, [], "ascii", expect_live=2)
    if rows:
        s.check("blank N, D, L are null", rows[0] == {"N": None, "D": None, "L": None, "C": ""}, repr(rows[0]))

    # shapelib writes a null number as asterisks over the whole width.
    shp = os.path.join(d, "shape.dbf")
    with s.case("shapelib write"):
        must(["dbfcreate", shp, "-s", "NAME", "8", "-n", "QTY", "6", "0", "-n", "PRICE", "10", "3"])
        must(["dbfadd", shp, "a", "1", "2.5"])
        must(["dbfadd", shp, "", "", ""])
    s.compare_table("shapelib null numbers", shp, [], "ascii", expect_live=2)

    # GDAL writes null numbers as asterisks and a null date as 00000000.
    csv = os.path.join(d, "in.csv")
    with open(csv, "w") as f:
        f.write("id,amount,born,name\n1,2.5,2001-02-03,a\n,,,\n")
    gdal = os.path.join(d, "gdal.dbf")
    with s.case("ogr2ogr"):
        must(["ogr2ogr", "-f", "ESRI Shapefile", "-oo", "AUTODETECT_TYPE=YES", gdal, csv])
    s.compare_table("GDAL null numbers and dates", gdal, [], "ascii", expect_live=2)

    # python3-dbf, Visual FoxPro: an empty date-time is eight zero bytes.
    vfp = os.path.join(d, "blank.dbf")
    t = dbf.Table(vfp, "N N(5,1); D D; L L; C C(3); T T; I I; Y Y; B B", dbf_type="vfp")
    t.open(dbf.READ_WRITE)
    t.append((None,) * 8)
    t.close()
    s.compare_table("Visual FoxPro blanks", vfp, ["--dialect", "10", "--memo", "errors"], "ascii", expect_live=1)

s.done()
