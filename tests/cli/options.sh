# The command line: options before or after the file names, as "--opt value"
# or "--opt=value"; --dialect by number or name in any case, or picked by the
# version byte; the exit status (1 when a table can't be read, 2 for a wrong
# command line) with its one "zqdb: " line.
source "$(dirname "$0")/lib.bash" "$1"

make_table "$WORK/t.dbf"
expected=$(printf 'NAME,QTY\r\nalice,42\r\n')
same_csv() {  # same_csv ARGS...: cat's output is the table's CSV
  "$ZQDB" "$@" >"$OUT" 2>"$ERR"
  if [ "$?" -eq 0 ] && [ "$(cat "$OUT")" = "$expected" ]; then PASSED=$((PASSED + 1))
  else fail "zqdb $*: $(head -c 200 "$OUT") $(head -c 200 "$ERR")"; fi
}
same_csv --format csv cat "$WORK/t.dbf"
same_csv cat "$WORK/t.dbf" --format=csv --dialect=1 --codepage=0 --memo=always
same_csv --dialect 4 --codepage 850 cat --memo never "$WORK/t.dbf"

# --- Dialects ----------------------------------------------------------------
# The dialect shows in info; the last --dialect given wins; other products'
# names map to their dialect.
make_table "$WORK/vfp.dbf" 30
make_table "$WORK/fox.dbf" f5  # FoxPro's byte without a memo field
while IFS='|' read -r want table args; do
  eval "set -- $args"
  expect_run 0 info "$WORK/$table" "$@" && expect_out "dialect:     $want"
done <<'X'
2 (dBASE IV)|t.dbf|
4 (dBASE III)|t.dbf|--dialect=4
8 (Clipper)|t.dbf|--dialect clipper
1 (dBASE III+)|t.dbf|--dialect "dbase iii+"
2 (dBASE IV)|t.dbf|--dialect "DBASE iv"
9 (Visual dBASE 5.5)|t.dbf|--dialect "visual dbase 5.5"
7 (Enable OA (Database))|t.dbf|--dialect "enable oa (database)"
6 (FoxPro)|t.dbf|--dialect 8 --dialect FOXPRO
1 (dBASE III+)|t.dbf|--dialect "Foxbase+"
4 (dBASE III)|t.dbf|--dialect "act! for windows"
6 (FoxPro)|t.dbf|--dialect "Telemagic (FoxPro)"
10 (Visual FoxPro)|vfp.dbf|--dialect "visual foxpro"
10 (Visual FoxPro)|vfp.dbf|
6 (FoxPro)|fox.dbf|--memo always
X

# Without --dialect the version byte (and for 0x8B the memo file's form)
# picks the dialect (tables of every dialect read back as written:
# tests/interop/test_convert.py). Here the two forms of 0x8B.
printf 'NAME,NOTE\nann,%s\n' "$(head -c 300 /dev/zero | tr '\0' m)" >"$WORK/in.csv"
for d in 2 7; do expect_run 0 convert "$WORK/in.csv" "$WORK/t$d.dbf" --to "$d" --no-progress; done
expect_run 0 info "$WORK/t7.dbf" && expect_out "dialect:     7 (Enable OA (Database))"
expect_run 0 info "$WORK/t2.dbf" && expect_out "dialect:     2 (dBASE IV)"

# A dBASE II table reads under dialect 0 or by its byte; dBASE IV refuses it.
# Version, count 1, date, record length 6, one descriptor, and room for more:
# the first record at 521.
{ printf '\x02\x01\x00\x01\x01\x01\x06\x00NAME\0\0\0\0\0\0\0C\x05\0\0\0\r'; zeros 496
  printf ' hello'; } >"$WORK/db2.dbf"
expect_run 0 cat "$WORK/db2.dbf" --dialect "dbase ii" --format jsonl && expect_out '{"NAME":"hello"}'
expect_run 0 cat "$WORK/db2.dbf" --format jsonl && expect_out '{"NAME":"hello"}'

# --- Tables that can't be read: status 1, "zqdb: Error opening data file" ----
# (each reason's own message is checked in usage.sh); cat prints nothing.
head -c 50 "$WORK/t.dbf" >"$WORK/cut.dbf"  # cut inside the field descriptors
for args in "$WORK/cut.dbf" "$WORK/vfp.dbf --dialect 2" "$WORK/t.dbf --dialect 10" \
  "$WORK/db2.dbf --dialect 2"; do
  # shellcheck disable=SC2086
  expect_run 1 cat $args && expect_err "zqdb: Error opening data file"
  ok "zqdb cat $args: output for a table that can't be read" not test -s "$OUT"
done

# --- Usage errors: status 2, "zqdb: ..." first, before any table is opened ----
expect_run 2 && expect_err "usage: zqdb"
expect_run 2 frobnicate "$WORK/t.dbf" && expect_err "zqdb: unknown command"
expect_run 2 cat "$WORK/t.dbf" --bogus && expect_err "zqdb: unknown option --bogus"
while read -r args; do
  eval "set -- $args"
  expect_run 2 "$@" && expect_err "zqdb: "
done <<X
cat
cat "$WORK/t.dbf" "$WORK/t.dbf"
--verbose cat "$WORK/t.dbf"
cat "$WORK/missing.dbf" --format xml
cat "$WORK/t.dbf" --format
cat "$WORK/t.dbf" --codepage 12345
cat "$WORK/t.dbf" --memo sometimes
cat "$WORK/t.dbf" --dialect 11
cat "$WORK/t.dbf" --dialect -1
cat "$WORK/t.dbf" --dialect "dBASE V"
cat "$WORK/t.dbf" --dialect ""
X
expect_run 0 --help && expect_out "usage: zqdb"

finish
