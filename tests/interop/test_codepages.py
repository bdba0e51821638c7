"""Tables that zqdb writes in code page 1252 or 850, with text beyond ASCII
in character and memo fields, read back by dbfread (with the encoding the
.cpg file beside the table names) and by python3-dbf, text for text."""

import os
import sys

import dbf

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
from common import Suite, dbfread_rows, run, workdir, ZQDB  # noqa: E402

s = Suite("codepages")

# Characters each code page holds: 1252 has the euro sign, 850 box drawing.
TEXT = {"1252": ["Zoë Ærø", "Straße €5", "naïve façade"],
        "850": ["Zoë Ærø", "Straße ½", "naïve ╬ façade"]}
# dBASE III, dBASE IV, FoxPro, Visual FoxPro; python3-dbf refuses dBASE IV
# tables with a memo (0x8B), and dbfread reads a dBASE IV memo 8 bytes too
# long (the block's length word taken as the text's): its text is compared
# as a prefix there. python3-dbf reads a dBASE III memo on to a pair of end
# marks where one ends it: its text is taken up to the first.
DIALECTS = [("4", "db3"), ("2", None), ("6", "fp"), ("10", "vfp")]

with workdir() as d:
    for cp, words in TEXT.items():
        src = os.path.join(d, "in_%s.csv" % cp)
        with open(src, "w", encoding="utf-8") as f:
            f.write("NAME,NOTE\n")
            for w in words:
                f.write('%s,"%s, %s"\n' % (w, w, w * 30))
        want = [(w, "%s, %s" % (w, w * 30)) for w in words]
        for dialect, pydbf_type in DIALECTS:
            label = "cp%s dialect %s" % (cp, dialect)
            path = os.path.join(d, "t_%s_%s.dbf" % (cp, dialect))
            with s.case(label + " convert"):
                rc, _, err = run([ZQDB, "convert", src, path, "--to", dialect, "--codepage", cp,
                                  "--schema", "NAME C(20), NOTE M"])
                s.check(label + " convert", rc == 0 and err == "", err.strip())
                with open(path[:-4] + ".cpg") as f:
                    encoding = "cp" + f.read().strip()
            with s.case(label + " dbfread"):
                got = [(r["NAME"], r["NOTE"]) for r in dbfread_rows(path, encoding)]
                if dialect == "2":
                    got = [(n, m[:len(w[1])]) for (n, m), w in zip(got, want)]
                s.check(label + " dbfread", got == want, repr(got[:1]))
            if pydbf_type is None:
                continue
            with s.case(label + " python3-dbf"):
                t = dbf.Table(path, codepage="cp" + cp)
                t.open(dbf.READ_ONLY)
                got = [(r.name.strip(), r.note.split("\x1a")[0].strip()) for r in t]
                t.close()
                s.check(label + " python3-dbf", got == want, repr(got[:1]))

s.done()
