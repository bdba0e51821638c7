# Append and update runs that fail on a value leave the table, its memo file
# and its index files byte for byte as they were: every value is checked
# before the first write, from a CSV file or a table alike.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# unchanged WHAT: the table's files are byte for byte as in `sums`
unchanged() { ok "$1: the table changed" cmp -s sums <(cksum k.dbf k.dbt k.mdx); }

printf 'ID,NAME,NOTE\n1,ann,first memo\n2,bob,second memo\n' >k.csv
expect_run 0 convert k.csv k.dbf --schema "ID N(3), NAME C(5), NOTE M" --index BYNAME=NAME
cksum k.dbf k.dbt k.mdx >sums

# Good lines, then a bad one: nothing of the good lines is added. An update
# would replace record 1 and add a new record before its bad line.
while IFS='|' read -r lines mode message; do
  printf "ID,NAME,NOTE\n$lines" >bad.csv
  # shellcheck disable=SC2086
  expect_run 1 convert bad.csv k.dbf --mode $mode && expect_err "zqdb: $message"
  unchanged "$mode, $message"
done <<'X'
3,cy,m3\n4,dee,m4\nx5,eve,m5\n|append|line 4, field ID: "x5" is not a number
3,cy,m3\n4,dee,m4\n5555,eve,m5\n|append|record 3, field ID: "5555" doesn't fit a N(3) field
3,cy,m3\n4,dee\n|append|line 3 has 2 fields, the header has 3
1,ANN,new memo\n9,zed,m9\n1000,bad,m\n|update --key ID|record 3, field ID: "1000" doesn't fit a N(3) field
X
# From a table: its third record doesn't fit.
printf 'ID,NAME,NOTE\n7,gil,m7\n8,hal,m8\n12345,ivy,m9\n' >src.csv
expect_run 0 convert src.csv src.dbf --schema "ID N(5), NAME C(5), NOTE M"
expect_run 1 convert src.dbf k.dbf --mode append && expect_err 'zqdb: record 3, field ID: "12345" doesn'"'"'t fit a N(3) field'
unchanged "append from a table"
# A good run after them: added, the index kept current.
printf 'ID,NAME,NOTE\n3,cy,m3\n' >good.csv
expect_run 0 convert good.csv k.dbf --mode append
expect_run 0 keys k.dbf --index BYNAME && expect_out "cy,3"
finish
