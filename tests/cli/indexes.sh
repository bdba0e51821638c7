# Indexes through zqdb: convert --index makes them, keys walks them, info
# lists them, appends keep them current; wrong definitions are usage errors
# or clear refusals, and a dialect without index files says so.
source "$(dirname "$0")/lib.bash" "$1"

cd "$WORK" || exit 1

printf 'NAME,CITY,QTY\nbob,ROME,3\nann,PARIS,1\ncid,ROME,2\nann,OSLO,5\n' >people.csv
printf 'NAME,CITY,QTY\nabe,LIMA,4\n' >more.csv

# --- Made, listed and walked --------------------------------------------------
expect_run 0 convert people.csv p.dbf --index name=NAME --unique-index byc=CITY+NAME --index "$WORK/q.ndx=QTY" --no-progress
err_has "index $WORK/q.ndx: its numeric or date keys are 8-byte doubles"
expect_run 0 info p.dbf && expect_out "NAME        C    yes        NAME" && expect_out "BYC         C    no         CITY+NAME"
expect_run 0 keys p.dbf --index NAME
out_is <<'OUT'
key,recno
ann,2
ann,4
bob,1
cid,3
OUT
expect_run 0 keys p.dbf --index byc --format jsonl --seek P
out_is <<'OUT'
{"key": "PARISann", "recno": 2}
{"key": "ROME bob", "recno": 1}
{"key": "ROME cid", "recno": 3}
OUT
# Numeric keys are doubles in their stored byte order, least significant
# byte first: 2.0 stores 00 .. 00 40, 1.0 00 .. F0 3F, so 2 comes first.
expect_run 0 keys p.dbf --index "$WORK/q.ndx"
out_is <<'OUT'
key,recno
2,3
3,1
5,4
1,2
OUT
expect_run 0 keys p.dbf --index "$WORK/q.ndx" --reverse --seek 5
out_is <<'OUT'
key,recno
5,4
3,1
2,3
OUT
expect_run 2 keys p.dbf --index NAME --reverse && expect_err "zqdb: an MDX tag is walked forwards only"
expect_run 1 keys p.dbf --index NOPE && expect_err "zqdb: no index NOPE could be opened (the table's indexes: NAME, BYC)"
expect_run 2 keys p.dbf && expect_err "zqdb: keys needs --index NAME"

# A damaged NDX: the first key's record number (block 1, entry 0) is 65536.
cp q.ndx bad.ndx && patch bad.ndx 520 '\x00\x00\x01\x00'
expect_run 1 keys p.dbf --index "$WORK/bad.ndx" && err_has "name records past the table's last (4): the index doesn't match the table"

# --- Update: the tags are rebuilt, so the old key is gone ------------------------
printf 'NAME,CITY,QTY\nzed,ROME,3\n' >upd.csv
expect_run 0 convert upd.csv p.dbf --mode update --key QTY --no-progress && err_has "2 indexes of p.dbf rebuilt: NAME BYC"
expect_run 0 keys p.dbf --index NAME && expect_out "zed,1"
ok "the old key of an updated record is still there" not grep -q "bob,1" "$OUT"
expect_run 0 check p.dbf

# --- Refused definitions ------------------------------------------------------
expect_run 2 convert people.csv x.dbf --index NAME --no-progress && expect_err "zqdb: --index takes NAME=EXPR"
expect_run 1 convert people.csv x.dbf --index "A=UPPER(NAME)" --no-progress && expect_err 'zqdb: index A: cannot index on "UPPER(NAME)"'
expect_run 1 convert people.csv x.dbf --index "A=NOPE" --no-progress && expect_err 'zqdb: index A: cannot index on "NOPE"'
expect_run 1 convert people.csv x.dbf --index "TOOLONGNAME1=NAME" --no-progress && expect_err "a tag name is 1 to 10 letters"
expect_run 1 convert people.csv x.dbf --index "A=STR(QTY,5)" --no-progress && expect_err '"STR(QTY,5)" would be stored as "QTY"'
expect_run 1 convert people.csv x.dbf --index "a.idx=NAME" --no-progress && expect_err "an index file of this dialect ends in .ndx"
expect_run 1 convert people.csv x.dbf --index A=NAME --index a=CITY --no-progress && expect_err "index A is given twice"
expect_run 1 convert more.csv p.dbf --mode append --index A=NAME --no-progress && expect_err "zqdb: --index makes the indexes of a new table"
absent x.dbf
printf 'ID,K\n1,3\n2,x\n' >bad.csv
expect_run 1 convert bad.csv x.dbf --schema "ID N(3), K N(4)" --index "$WORK/k.ndx=ID" --no-progress
absent k.ndx

# --- A replaced table takes its old MDX file with it ---------------------------
cp p.dbf r.dbf && cp p.mdx r.mdx
expect_run 0 convert people.csv r.dbf --no-progress && err_has "removed r.mdx, the index file of the table this one replaced"
absent r.mdx

# --- A dialect without index files -------------------------------------------
expect_run 0 convert people.csv c.dbf --to clipper --index A=NAME --no-progress
err_has "this dialect has no index files: 1 index definition(s) ignored"
absent c.mdx

# --- FoxPro: CDX tags and IDX files, found without --dialect ------------------
expect_run 0 convert people.csv f.dbf --to foxpro --index name=NAME --index "$WORK/f.idx=CITY" --index-form plain --no-progress
expect_run 0 info f.dbf && expect_out "dialect:     6 (FoxPro)" && expect_out "NAME        C    yes        name"
expect_run 0 convert more.csv f.dbf --mode append --no-progress
expect_run 0 keys f.dbf --index name --reverse
out_is <<'OUT'
key,recno
cid,3
bob,1
ann,4
ann,2
abe,5
OUT
expect_run 0 keys f.dbf --index "$WORK/f.idx" && expect_out "ROME,3"
# A walk that meets a block it can't read says so: the first leaf's right
# sibling (offset 8 of the block at 512) points past the end of the file.
cp f.idx broken.idx && patch broken.idx 520 '\x00\x00\x01\x00'
expect_run 1 keys f.dbf --index "$WORK/broken.idx" && err_has "stopped at a block it couldn't follow"

# --- Appending where the dialect keeps no index ----------------------------
expect_run 0 convert more.csv c.dbf --to clipper --no-progress
: >c.ntx
expect_run 0 convert more.csv c.dbf --mode append --no-progress
err_has "c.dbf has index files (.ntx) that this dialect doesn't keep: they will be out of date"

# --- check: one thing damaged at a time is found and named; reindex mends keys --
printf 'NAME,BORN,QTY,NOTE\nbob,2001-02-03,3,hello\nann,1999-12-31,1,a longer note\ncid,2000-02-29,2,x\n' >d.csv
expect_run 0 convert d.csv d.dbf --schema "NAME C(10), BORN D, QTY N(5,0), NOTE M" --index name=NAME --no-progress
expect_run 0 check d.dbf && expect_out "d.dbf: clean (3 records, the memo file, 1 index)"
# name | python patch of the bytes b (header length h, record length r) | what check says
while IFS='|' read -r name patch says; do
  cp d.dbf x.dbf && cp d.dbt x.dbt && cp d.mdx x.mdx
  python3 -c "
import struct
b = bytearray(open('x.dbf', 'rb').read()); h, r = struct.unpack('<HH', b[8:12])
$patch
open('x.dbf', 'wb').write(b)"
  expect_run 1 check x.dbf
  ok "$name: check lacks '$says': $(head -c 400 "$OUT")" grep -qF -- "$says" "$OUT"
done <<'CASES'
key|b[h + r + 1] = ord('z')|index NAME: record 2: key 'ann' differs from 'znn'
flag|b[h + 2 * r] = ord('X')|delete flag 0x58 is neither blank nor
deleted|b[h + 2 * r] = ord('*')|index NAME: record 3: key 'cid' names a deleted record
date|b[h + 11:h + 19] = b'20011399'|BORN '20011399' has no month 1-12
number|b[h + 19:h + 24] = b'  1x2'|QTY '  1x2' is no number
short|del b[-r // 2:]|the header counts 3 records, the file holds 2 whole ones
huge|b[7] = 0xF5|the header counts 4110417923 records, the file holds 3 whole ones
extra|b[4] -= 1|bytes stand behind the last of the header's 2 records
memo|b[h + 34:h + 34] = b''; b[h + 24:h + 34] = b'       999'|block 999 lies past the end of the memo file
shared|b[h + r + 24:h + r + 34] = b[h + 24:h + 34]|shares block 1 with the memo of record 1
CASES
cp d.dbt x.dbt && cp d.mdx x.mdx && cp d.dbf x.dbf
patch x.dbt 0 '\x01\0\0\0'
expect_run 1 check x.dbf --format json && expect_out '"part": "memo", "record": 3' && expect_out "next free block 1 lies below"
cp d.dbt x.dbt && patch x.mdx 32 '\x04\0\0\0'
expect_run 1 check x.dbf && expect_out "index NAME: block 0: the file header's next free block 4 lies inside this tag's tree"
# reindex rebuilds the tags (records another program appended get their keys
# back: tests/interop/test_index_*.py) or adds one.
expect_run 0 reindex d.dbf && err_has "1 index of d.dbf rebuilt: NAME"
expect_run 0 reindex d.dbf --unique-index up=NAME && expect_run 0 keys d.dbf --index UP && expect_out "cid,3"
expect_run 2 check d.dbf --format table

finish
