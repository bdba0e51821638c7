# Numbers that don't fit their target field stop the run with the record,
# field and value named, before anything is written; currency is carried
# exactly, whatever its size.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# value, schema, target dialect, the error's end ("" = it fits); each a line
while IFS='|' read -r value schema to want; do
  printf 'V\n%s\n' "$value" >n.csv
  rm -f n.dbf
  expect_run "$([ -z "$want" ]; echo $?)" convert n.csv n.dbf --schema "V $schema" --to "$to" || continue
  [ -n "$want" ] && expect_err "zqdb: record 1, field V: \"$value\" $want" && absent n.dbf
done <<'ROWS'
12345|N(3)|2|doesn't fit a N(3) field
12345|N(3)|4|doesn't fit a N(3) field
999|N(3)|2|
-99|N(3)|2|
-100|N(3)|2|doesn't fit a N(3) field
-99.5|N(4,1)|2|doesn't fit a N(4,1) field
-99.5|N(4,1)|6|doesn't fit a N(4,1) field
99.5|N(4,1)|2|
-9.95|N(4,1)|2|doesn't fit a N(4,1) field
99.96|N(4,1)|2|doesn't fit a N(4,1) field
00000000012|N(3)|2|
12345678901234567890|N(20)|2|
123456789012345678901|N(20)|2|doesn't fit a N(20) field
2147483647|I|10|
-2147483649|I|10|doesn't fit a I field
922337203685477.5807|Y|10|
-922337203685477.5808|Y|10|doesn't fit a Y field
ROWS

# A double of Visual FoxPro to dBASE III's N(20,6): 1.5e13 has 14 digits
# before the point, one too many; -2.5e14 more so.
printf 'V\n15000000000000\n' >b.csv
expect_run 0 convert b.csv b.dbf --schema "V B" --to "Visual FoxPro"
expect_run 1 convert b.dbf b3.dbf --to "dBASE III" && err_has 'zqdb: record 1, field V: "15000000000000" doesn'"'"'t fit a N(20,6) field'
absent b3.dbf

# Currency, exactly, from a table to a table and out as CSV and JSON.
printf 'Y\n-922337203685477.5807\n922337203685477.5807\n0.0001\n2.3\n' >y.csv
expect_run 0 convert y.csv y.dbf --schema "Y Y" --to 10
expect_run 0 convert y.dbf y2.dbf
expect_run 0 cat y2.dbf --format jsonl && out_is <<'X'
{"Y":-922337203685477.5807}
{"Y":922337203685477.5807}
{"Y":0.0001}
{"Y":2.3}
X
expect_run 0 cat y2.dbf && expect_out "-922337203685477.5807"
finish
