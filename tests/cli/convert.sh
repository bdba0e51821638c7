# convert: bad input gives one clear error, exit 1, the source untouched and
# no half-written table; what doesn't fit a dialect gives a warning; append
# and update keep the table's own layout.
source "$(dirname "$0")/lib.bash" "$1"

# same_sum FILE SUM: FILE's checksum is still SUM.
same_sum() {
  if [ "$(cksum <"$1" 2>/dev/null)" = "$2" ]; then PASSED=$((PASSED + 1)); else fail "$1 changed"; fi
}
# cat_is TABLE < EXPECTED: zqdb cat TABLE prints EXPECTED exactly.
cat_is() {
  cat >"$WORK/want"
  "$ZQDB" cat "$1" 2>"$WORK/cat_err" | tr -d '\r' >"$WORK/got"
  if cmp -s "$WORK/want" "$WORK/got"; then PASSED=$((PASSED + 1))
  else fail "cat $1:"; diff "$WORK/want" "$WORK/got" | head -10; head -3 "$WORK/cat_err"; fi
}

cd "$WORK" || exit 1

# --- Bad input ---------------------------------------------------------------
printf 'NAME,QTY,BORN\nann,1,2020-01-01\nbob,2\n' >ragged.csv
printf 'NAME,QTY,BORN\nann,1,2020-01-01\nbob,x2,2020-01-02\n' >badnum.csv
printf 'NAME,QTY,BORN\nann,1,2020-02-30\n' >baddate.csv
printf 'NAME,QTY,BORN\nann,1,2020-01-01\n' >good.csv
for f in ragged badnum baddate good; do eval "sum_$f=\"$(cksum <$f.csv)\""; done
SCHEMA="NAME C(10), QTY N(5), BORN D"

expect_run 1 convert ragged.csv out.dbf --no-progress && expect_err "zqdb: line 3 has 2 fields, the header has 3"
absent out.dbf
expect_run 1 convert ragged.csv out.dbf --schema "$SCHEMA" && expect_err "zqdb: line 3 has 2 fields, the header has 3"
absent out.dbf out.dbt
expect_run 1 convert badnum.csv out.dbf --schema "$SCHEMA" && expect_err 'zqdb: line 3, field QTY: "x2" is not a number'
absent out.dbf
expect_run 1 convert baddate.csv out.dbf --schema "$SCHEMA" && expect_err 'zqdb: line 2, field BORN: "2020-02-30" is not a date'
absent out.dbf
printf 'WHEN\n2024-13-01T00:00:00\n' >badtime.csv
expect_run 1 convert badtime.csv out.dbf --to 10 --schema "WHEN T" && expect_err 'zqdb: line 2, field WHEN: "2024-13-01T00:00:00" is not a date-time'
absent out.dbf
expect_run 1 convert badnum.csv out.dbf --schema "NAME X" && expect_err "zqdb: unknown type in the schema"
expect_run 1 convert badnum.csv out.dbf --schema "NAME C(300)" && expect_err "zqdb: width outside 1 to 255"
expect_run 1 convert badnum.csv out.dbf --schema "NOPE C(3)" && expect_err "zqdb: the schema names NOPE"
same_sum ragged.csv "$sum_ragged"
same_sum badnum.csv "$sum_badnum"
same_sum baddate.csv "$sum_baddate"

# Targets that can't be made: a missing directory, a path under a regular
# file, /proc (refuses new files even to root).
: >plainfile
for dst in "$WORK/nodir/out.dbf" "$WORK/plainfile/out.dbf" /proc/zqdb-out.dbf; do
  expect_run 1 convert good.csv "$dst" && expect_err "zqdb: cannot create $dst"
  absent "$dst"
done
expect_run 1 convert missing.csv out.dbf && expect_err "zqdb: cannot open missing.csv"
same_sum good.csv "$sum_good"

# Append to a file that is no table: refused, the file unchanged.
printf 'just some text\n' >text.dbf
sum_text=$(cksum <text.dbf)
expect_run 1 convert good.csv text.dbf --mode append && expect_err "zqdb: Error opening data file"
same_sum text.dbf "$sum_text"

# A bad record in replace mode over an existing table: the old table and its
# memo file stay as they were.
expect_run 0 convert good.csv keep.dbf --schema "NAME C(10), QTY N(5), BORN D"
printf 'NAME,NOTE\nann,a memo\n' >memo.csv
expect_run 0 convert memo.csv keepm.dbf --schema "NAME C(10), NOTE M"
sum_keep=$(cksum <keep.dbf)
sum_keepm=$(cksum <keepm.dbf)$(cksum <keepm.dbt)
expect_run 1 convert badnum.csv keep.dbf --schema "$SCHEMA"
same_sum keep.dbf "$sum_keep"
printf 'NAME,NOTE\nann,fine\nbob,"unterminated\n' >badmemo.csv
expect_run 1 convert badmemo.csv keepm.dbf --schema "NAME C(10), NOTE M"
if [ "$(cksum <keepm.dbf)$(cksum <keepm.dbt 2>/dev/null)" = "$sum_keepm" ]; then PASSED=$((PASSED + 1))
else fail "replace mode with a bad record lost the old table keepm.dbf"; fi

# Values that the existing table's fields can't hold: an error, not a table
# that other programs can't read (text in N) or a value lost without a word
# (text in D).
expect_run 0 convert good.csv app.dbf --schema "$SCHEMA"
sum_app=$(cksum <app.dbf)
printf 'NAME,QTY,BORN\ncat,abc,2021-01-01\n' >textnum.csv
expect_run 1 convert textnum.csv app.dbf --mode append && err_has "QTY"
same_sum app.dbf "$sum_app"
printf 'NAME,QTY,BORN\ncat,3,hello\n' >textdate.csv
expect_run 1 convert textdate.csv app.dbf --mode append && err_has "BORN"
same_sum app.dbf "$sum_app"

# Text that looks like a logical or a number stays as it is in a text field
# of the table ("y" is no "T", "007" no "7").
printf 'NAME,QTY,BORN\ny,4,2021-01-01\n' >yes.csv
expect_run 0 convert yes.csv app.dbf --mode append
printf 'NAME,QTY,BORN\n007,5,2021-01-02\n' >zeros.csv
expect_run 0 convert zeros.csv app.dbf --mode append
cat_is app.dbf <<'X'
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
rc=$?
if [ "$rc" -eq 1 ]; then PASSED=$((PASSED + 1)); else fail "convert into a file that can't grow: exit $rc, expected 1"; fi
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
  if grep -q "NOTE" "$ERR"; then fail "C(255) to dialect $d warned: $(cat "$ERR")"; else PASSED=$((PASSED + 1)); fi
  expect_run 0 info notes$d.dbf && expect_out "  2    NOTE        C      255    0"
  "$ZQDB" cat notes$d.dbf --format jsonl >"$OUT"
  expect_out "\"NOTE\":\"${long:0:255}\""
done
expect_run 0 convert notes.csv notes2.dbf --to 2
absent notes2.dbf.missing
[ -s notes2.dbt ] && PASSED=$((PASSED + 1)) || fail "no memo file beside notes2.dbf"
if grep -q "NOTE" "$ERR"; then fail "a memo in dBASE IV warned: $(cat "$ERR")"; else PASSED=$((PASSED + 1)); fi
"$ZQDB" cat notes2.dbf --format jsonl >"$OUT"
expect_out "\"NOTE\":\"$long\""
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
cat_is people.dbf <<'X'
NAME,QTY
alice,42
carol,5
X
printf 'NAME,QTY\ncarol,6\ndave,7\nalice,43\ncarol,8\n' >upd.csv
expect_run 0 convert upd.csv people.dbf --mode update --key NAME
err_has "zqdb: 3 records updated, 1 added"
cat_is people.dbf <<'X'
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
