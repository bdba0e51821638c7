# Append and update runs that fail on a value leave the table, its memo file
# and its index files byte for byte as they were: every value is checked
# before the first write, from a CSV file or a table alike.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# unchanged: the table's files are byte for byte as in `sums`
unchanged() {
  if cmp -s sums <(cksum k.dbf k.dbt k.mdx); then PASSED=$((PASSED + 1)); else fail "$1: the table changed"; fi
}

printf 'ID,NAME,NOTE\n1,ann,first memo\n2,bob,second memo\n' >k.csv
expect_run 0 convert k.csv k.dbf --schema "ID N(3), NAME C(5), NOTE M" --index BYNAME=NAME
cksum k.dbf k.dbt k.mdx >sums

# Lines 2 and 3 are good, line 4 is not: nothing of lines 2-3 is added.
printf 'ID,NAME,NOTE\n3,cy,m3\n4,dee,m4\nx5,eve,m5\n' >badtext.csv
expect_run 1 convert badtext.csv k.dbf --mode append && expect_err 'zqdb: line 4, field ID: "x5" is not a number'
unchanged "append, text in a number"
printf 'ID,NAME,NOTE\n3,cy,m3\n4,dee,m4\n5555,eve,m5\n' >wide.csv
expect_run 1 convert wide.csv k.dbf --mode append && expect_err 'zqdb: record 3, field ID: "5555" doesn'"'"'t fit a N(3) field'
unchanged "append, a number too wide"
printf 'ID,NAME,NOTE\n3,cy,m3\n4,dee\n' >ragged.csv
expect_run 1 convert ragged.csv k.dbf --mode append && expect_err "zqdb: line 3 has 2 fields, the header has 3"
unchanged "append, a short line"
# Update: record 1 would be replaced and a new one added before the bad one.
printf 'ID,NAME,NOTE\n1,ANN,new memo\n9,zed,m9\n1000,bad,m\n' >upd.csv
expect_run 1 convert upd.csv k.dbf --mode update --key ID && expect_err 'zqdb: record 3, field ID: "1000" doesn'"'"'t fit a N(3) field'
unchanged "update"
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
