# Where convert writes: "-" is standard output, a symbolic link is written
# through and stays a link, a device, FIFO or directory takes no table, and a
# name of a format zqdb doesn't write is a usage error.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1
make_table t.dbf
# (What "-" takes, CSV and JSON lines, is checked in csv_input.sh.)
expect_run 0 convert t.dbf - && expect_out "alice,42"
absent ./-
expect_run 2 convert t.dbf - --to 4 && expect_err "zqdb: a table can't be written to standard output"
expect_run 2 convert t.dbf - --format table

# A link to a table: the table it points to is replaced, the link stays.
mkdir real
make_table real/old.dbf
ln -s real/old.dbf link.dbf
printf 'NAME\nnew\n' >new.csv
expect_run 0 convert new.csv link.dbf
same "the link stays" "$(readlink link.dbf)" "real/old.dbf"
expect_run 0 cat real/old.dbf && expect_out "new"
ln -s real/out.csv link.csv
: >real/out.csv
expect_run 0 convert t.dbf link.csv
same "a CSV link stays" "$(readlink link.csv)$(tr -d '\r' <real/out.csv | tail -1)" "real/out.csvalice,42"
# A link to nothing is refused, and nothing is made.
ln -s real/none.dbf dangling.dbf
expect_run 1 convert t.dbf dangling.dbf && expect_err "zqdb: dangling.dbf is a symbolic link to a file that doesn't exist"
absent real/none.dbf

# A FIFO takes CSV as it is written, but no table; a directory nothing.
mkfifo pipe.csv pipe.dbf
cat pipe.csv >from_pipe &
expect_run 0 convert t.dbf pipe.csv
wait
same "CSV through a FIFO" "$(tr -d '\r' <from_pipe)" "NAME,QTY
alice,42"
expect_run 1 convert t.dbf pipe.dbf && expect_err "zqdb: pipe.dbf is a device, FIFO or socket: a table is written to a regular file"
ok "pipe.dbf is no FIFO any more" test -p pipe.dbf
mkdir dir.dbf
expect_run 1 convert t.dbf dir.dbf && expect_err "zqdb: dir.dbf is a directory"
# /dev/stdout on a pipe is a device link: refused for a table, and it stays
# the link it was (run as root, the link was once replaced by a table).
"$ZQDB" convert t.dbf /dev/stdout 2>"$ERR" | cat >/dev/null
same "a table to /dev/stdout on a pipe" "$(head -c 57 "$ERR")" "zqdb: /dev/stdout is a device, FIFO or socket: a table is"
ok "/dev/stdout is no link any more" test -L /dev/stdout

# Names of formats zqdb doesn't write.
for name in out.tsv out.txt OUT.TXT; do
  expect_run 2 convert t.dbf "$name" && expect_err "zqdb: zqdb writes tables, CSV, JSON-lines, SQLite and PostgreSQL files, not $name"
  absent "$name"
done
finish
