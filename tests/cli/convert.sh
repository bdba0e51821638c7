# convert: bad input gives one clear error, exit 1, the source untouched and
# no half-written table; what doesn't fit a dialect gives a warning; append
# and update keep the table's own layout.
source "$(dirname "$0")/lib.bash" "$1"


cd "$WORK" || exit 1

# --- Bad input ---------------------------------------------------------------
printf 'NAME,QTY,BORN\nann,1,2020-01-01\nbob,2\n' >ragged.csv
printf 'NAME,QTY,BORN\nann,1,2020-01-01\nbob,x2,2020-01-02\n' >badnum.csv
printf 'NAME,QTY,BORN\nann,1,2020-02-30\n' >baddate.csv
printf 'NAME,QTY,BORN\nann,1,2020-01-01\n' >good.csv
printf 'WHEN\n2024-13-01T00:00:00\n' >badtime.csv
cksum ./*.csv >sources
SCHEMA="NAME C(10), QTY N(5), BORN D"
# source | options | the error
while IFS='|' read -r src args message; do
  eval "set -- $args"
  expect_run 1 convert "$src.csv" out.dbf "$@" && expect_err "zqdb: $message"
  absent out.dbf out.dbt
done <<'X'
ragged|--no-progress|line 3 has 2 fields, the header has 3
ragged|--schema "$SCHEMA"|line 3 has 2 fields, the header has 3
badnum|--schema "$SCHEMA"|line 3, field QTY: "x2" is not a number
baddate|--schema "$SCHEMA"|line 2, field BORN: "2020-02-30" is not a date
badtime|--to 10 --schema "WHEN T"|line 2, field WHEN: "2024-13-01T00:00:00" is not a date-time
badnum|--schema "NAME X"|unknown type in the schema
badnum|--schema "NAME C(300)"|width outside 1 to 255
badnum|--schema "NOPE C(3)"|the schema names NOPE
X

# Targets that can't be made: a missing directory, a path under a regular
# file, /proc (refuses new files even to root).
: >plainfile
for dst in "$WORK/nodir/out.dbf" "$WORK/plainfile/out.dbf" /proc/zqdb-out.dbf; do
  expect_run 1 convert good.csv "$dst" && expect_err "zqdb: cannot create $dst"
  absent "$dst"
done
expect_run 1 convert missing.csv out.dbf && expect_err "zqdb: cannot open missing.csv"
ok "a source changed" cmp -s sources <(cksum ./*.csv)

# Append to a file that is no table: refused, the file unchanged.
printf 'just some text\n' >text.dbf && cp text.dbf text.before
expect_run 1 convert good.csv text.dbf --mode append && expect_err "zqdb: Error opening data file"
same_file text.dbf text.before

# A bad record in replace mode over an existing table: the old table and its
# memo file stay as they were.
expect_run 0 convert good.csv keep.dbf --schema "NAME C(10), QTY N(5), BORN D"
printf 'NAME,NOTE\nann,a memo\n' >memo.csv
expect_run 0 convert memo.csv keepm.dbf --schema "NAME C(10), NOTE M"
cksum keep.dbf keepm.dbf keepm.dbt >tables
expect_run 1 convert badnum.csv keep.dbf --schema "$SCHEMA"
printf 'NAME,NOTE\nann,fine\nbob,"unterminated\n' >badmemo.csv
expect_run 1 convert badmemo.csv keepm.dbf --schema "NAME C(10), NOTE M"
ok "replace mode with a bad record changed the old table" cmp -s tables <(cksum keep.dbf keepm.dbf keepm.dbt)

# Text in a D field of the table, or from a table's C field in an N field:
# an error, not a value lost without a word (text of a CSV file in N:
# failed_append.sh).
expect_run 0 convert good.csv app.dbf --schema "$SCHEMA" && cp app.dbf app.before
printf 'NAME,QTY,BORN\ncat,3,hello\n' >textdate.csv
expect_run 1 convert textdate.csv app.dbf --mode append && err_has "BORN"
printf 'NAME,QTY,BORN\ncat,abc,2021-01-01\n' >textnum.csv && "$ZQDB" convert textnum.csv textnum.dbf
expect_run 1 convert textnum.dbf app.dbf --mode append &&
  expect_err 'zqdb: record 1, field QTY: "abc" doesn'"'"'t fit a N(5) field'
same_file app.dbf app.before

# Text that looks like a logical or a number stays as it is in a text field
# of the table ("y" is no "T", "007" no "7").
printf 'NAME,QTY,BORN\ny,4,2021-01-01\n007,5,2021-01-02\n' >yes.csv
expect_run 0 convert yes.csv app.dbf --mode append
expect_run 0 cat app.dbf && out_is <<'X'
NAME,QTY,BORN
ann,1,2020-01-01
y,4,2021-01-01
007,5,2021-01-02
X

# A table that can't grow: the run fails, whatever step meets the limit
# (here the close, which writes what is still buffered).
python3 -c "
print('NAME,QTY')
for i in range(2000): print('name%d,%d' % (i, i))" >many.csv
(ulimit -f 16; trap '' XFSZ; "$ZQDB" convert many.csv big.dbf --no-progress >"$OUT" 2>"$ERR")
same "exit status of a convert into a file that can't grow" $? 1
absent big.dbf

# --- Usage -------------------------------------------------------------------
expect_run 2 convert good.csv && expect_err "zqdb: convert takes a source and a target"
expect_run 2 convert good.csv out.dbf --key NAME && expect_err "zqdb: --key goes with --mode update"
expect_run 2 convert good.csv out.dbf --mode merge && expect_err "zqdb: --mode takes replace, append or update"
expect_run 2 convert good.csv out.dbf --to 11 && expect_err "zqdb: unknown dialect: 11"
expect_run 1 convert good.csv out.dbf --mode update && expect_err "zqdb: update mode needs --key"
expect_run 0 convert good.csv fixed.dbf --schema "QTY F(6,2)" && "$ZQDB" info fixed.dbf >"$OUT" &&
  expect_out "  2    QTY         F        6    2"
expect_run 1 convert good.csv out.csv --mode append && expect_err "zqdb: append and update modes need a table"
absent out.dbf out.csv

# --- Warnings ----------------------------------------------------------------
# 40 columns with long names to dBASE II: names shortened, 32 fields kept.
python3 -c "
print(','.join('column_number_%d' % i for i in range(40)))
print(','.join(str(i) for i in range(40)))" >wide.csv
expect_run 0 convert wide.csv wide.dbf --to 0
err_has "zqdb: warning: 32 field names were changed (column_number_0 -> COLUMN_NUM, column_number_1 -> COLUMN_N_2, column_number_2 -> COLUMN_N_3, ...)"
err_has "zqdb: warning: field column_number_32 and those behind it are left out: the target keeps 32 fields"
"$ZQDB" info wide.dbf >"$OUT" && expect_out "fields:      32"
# Memos to a dialect without them, long text, blank logicals.
long=$(printf 'z%.0s' {1..300})
printf 'NAME,NOTE,OK\nann,short note,true\nbob,%s,\n' "$long" >notes.csv
expect_run 0 convert notes.csv notes0.dbf --to 0 --schema "NOTE M, OK L"
err_has "zqdb: warning: 1 field type was changed (NOTE: memo folded to text of 255 bytes: this dialect has no memo fields)"
err_has "zqdb: warning: 1 field had values cut to its width (NOTE: 1 longer than 255 bytes)"
err_has "zqdb: warning: 1 logical field had blanks written as F (OK: 1)"
printf 'NAME,NOTE\nann,%s\n' "${long:0:255}" >text255.csv
# 255 bytes is the longest C of every dialect (Clipper's aside): C(255)
# stays C(255), whole, with or without memo fields.
for d in 0 3 4 6; do
  expect_run 0 convert text255.csv notes$d.dbf --to $d --schema "NOTE C(255)"
  ok "C(255) to dialect $d warned: $(cat "$ERR")" not grep -q NOTE "$ERR"
  expect_run 0 info notes$d.dbf && expect_out "  2    NOTE        C      255    0"
  "$ZQDB" cat notes$d.dbf --format jsonl >"$OUT"
  expect_out "\"NOTE\":\"${long:0:255}\""
done
expect_run 0 convert notes.csv notes2.dbf --to 2
ok "a memo in dBASE IV warned: $(cat "$ERR")" not grep -q NOTE "$ERR"
# --memo: never (the default) fails on a missing memo file, errors leaves the
# field blank; always writes no memo at all.
cp notes2.dbf nodbt.dbf
expect_run 1 cat nodbt.dbf --memo never
expect_run 0 cat nodbt.dbf --memo errors --format jsonl && expect_out '"NOTE":null'
expect_run 0 convert notes.csv nomemo.dbf --to 2 --memo always && "$ZQDB" cat nomemo.dbf --format jsonl >"$OUT" &&
  expect_out '{"NAME":"ann","NOTE":null,"OK":true}'
# A table to a table of a dialect without memos.
expect_run 0 convert notes2.dbf notes2to0.dbf --to 0
err_has "zqdb: warning: 1 field type was changed (NOTE: memo folded to text of 255 bytes"

# --- Append and update -------------------------------------------------------
# A dBASE III table with alice (live) and bob (deleted).
make_table people.dbf
printf 'NAME,QTY\ncarol,5\n' >more.csv
expect_run 0 convert more.csv people.dbf --mode append
expect_run 0 cat people.dbf && out_is <<'X'
NAME,QTY
alice,42
carol,5
X
printf 'NAME,QTY\ncarol,6\ndave,7\nalice,43\ncarol,8\n' >upd.csv
expect_run 0 convert upd.csv people.dbf --mode update --key NAME
err_has "zqdb: 3 records updated, 1 added"
expect_run 0 cat people.dbf && out_is <<'X'
NAME,QTY
alice,43
carol,8
dave,7
X
# The deleted record stays deleted and in its place.
"$ZQDB" info people.dbf >"$OUT" && expect_out "records:     4 in the header, 3 live"
# Source fields the table lacks, and table fields the source lacks.
printf 'NAME,COLOR\nerin,red\n' >other.csv
expect_run 0 convert other.csv people.dbf --mode append
err_has "zqdb: warning: 1 field of the table has no source field and is left blank (QTY)"
err_has "zqdb: warning: 1 source field is left out: the table has no such field (COLOR)"

finish
