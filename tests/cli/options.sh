# Options go before or after the file name, as "--opt value" or "--opt=value";
# --dialect takes a number or a name in any case.
source "$(dirname "$0")/lib.bash" "$1"

make_table "$WORK/t.dbf"
expected=$(printf 'NAME,QTY\r\nalice,42\r\n')

same_csv() {  # same_csv ARGS...: cat's output is the table's CSV
  "$ZQDB" "$@" >"$OUT" 2>"$ERR"
  if [ "$?" -eq 0 ] && [ "$(cat "$OUT")" = "$expected" ]; then PASSED=$((PASSED + 1))
  else fail "zqdb $*: $(head -c 200 "$OUT") $(head -c 200 "$ERR")"; fi
}
same_csv cat "$WORK/t.dbf"
same_csv cat --format csv "$WORK/t.dbf"
same_csv --format csv cat "$WORK/t.dbf"
same_csv cat "$WORK/t.dbf" --format=csv --dialect=1
same_csv --dialect 4 --codepage 850 cat --memo never "$WORK/t.dbf"
same_csv cat "$WORK/t.dbf" --codepage=0 --memo=always

# The dialect shows in info; the last --format or --dialect given wins.
dialect_is() {  # dialect_is "N (Name)" ARGS...
  local want=$1; shift
  expect_run 0 info "$WORK/t.dbf" "$@" && expect_out "dialect:     $want"
}
dialect_is "2 (dBASE IV)"
dialect_is "1 (dBASE III+)" --dialect 1
dialect_is "4 (dBASE III)" --dialect=4
dialect_is "8 (Clipper)" --dialect 8
dialect_is "2 (dBASE IV)" --dialect "dBASE IV"
dialect_is "2 (dBASE IV)" --dialect "DBASE iv"
dialect_is "1 (dBASE III+)" --dialect "dbase iii+"
dialect_is "4 (dBASE III)" --dialect "DBase III"
dialect_is "6 (FoxPro)" --dialect foxpro
dialect_is "6 (FoxPro)" --dialect FOXPRO
dialect_is "8 (Clipper)" --dialect clipper
dialect_is "9 (Visual dBASE 5.5)" --dialect "visual dbase 5.5"
dialect_is "7 (Enable OA (Database))" --dialect "enable oa (database)"
dialect_is "6 (FoxPro)" --dialect 8 --dialect FoxPro
# Other products' names map to their dialect.
dialect_is "1 (dBASE III+)" --dialect "Foxbase+"
dialect_is "4 (dBASE III)" --dialect "act! for windows"
dialect_is "6 (FoxPro)" --dialect "Telemagic (FoxPro)"

# Visual FoxPro by name and number reads a 0x30 table.
make_table "$WORK/vfp.dbf" 30
dialect_is_vfp() {
  expect_run 0 info "$WORK/vfp.dbf" "$@" && expect_out "dialect:     10 (Visual FoxPro)" && expect_out "version:     0x30"
}
dialect_is_vfp --dialect 10
dialect_is_vfp --dialect "visual foxpro"
dialect_is_vfp --dialect="Visual FoxPro"

# A FoxPro version byte (0xF5, with no memo field) turns the dBASE IV default
# into FoxPro.
make_table "$WORK/fox.dbf" f5
expect_run 0 info "$WORK/fox.dbf" --memo always && expect_out "dialect:     6 (FoxPro)"

# A dBASE II table needs dialect 0; under the default it is refused.
{
  printf '\x02\x01\x00\x01\x01\x01\x06\x00'            # version, count 1, date, record length 6
  printf 'NAME\x00\x00\x00\x00\x00\x00\x00C\x05\x00\x00\x00'
  printf '\x0d'
  printf '\x00%.0s' {1..496}                              # descriptor room: first record at 521
  printf ' hello'
} >"$WORK/db2.dbf"
expect_run 0 cat "$WORK/db2.dbf" --dialect 0 --format jsonl && expect_out '{"NAME":"hello"}'
expect_run 0 cat "$WORK/db2.dbf" --dialect "dbase ii" --format jsonl && expect_out '{"NAME":"hello"}'
expect_run 1 cat "$WORK/db2.dbf" --dialect 2 && expect_err "zqdb: Error opening data file"
expect_run 0 cat "$WORK/db2.dbf" --format jsonl && expect_out '{"NAME":"hello"}'

finish
