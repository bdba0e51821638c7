# Exit status and the one-line message: 1 when a table can't be read, 2 for
# a wrong command line, 0 otherwise.
source "$(dirname "$0")/lib.bash" "$1"

make_table "$WORK/t.dbf"
expect_run 0 cat "$WORK/t.dbf"

# Tables that can't be read: status 1, "zqdb: Error opening data file PATH".
expect_run 1 cat "$WORK/missing.dbf" && expect_err "zqdb: Error opening data file $WORK/missing.dbf"
expect_run 1 info "$WORK/missing.dbf" && expect_err "zqdb: Error opening data file"
: >"$WORK/empty.dbf"
expect_run 1 cat "$WORK/empty.dbf" && expect_err "zqdb: Error opening data file"
expect_run 1 cat "$WORK" && expect_err "zqdb: Error opening data file"
printf 'not a table at all, just text\n' >"$WORK/text.dbf"
expect_run 1 cat "$WORK/text.dbf" && expect_err "zqdb: Error opening data file"
# A version byte the dialect doesn't accept: Visual FoxPro's 0x30 under the
# default dBASE IV, dBASE III's 0x03 under Visual FoxPro.
make_table "$WORK/vfp.dbf" 30
expect_run 1 cat "$WORK/vfp.dbf" --dialect 2 && expect_err "zqdb: Error opening data file"
# Without --dialect the version byte picks the dialect, so the table reads.
expect_run 0 cat "$WORK/vfp.dbf"
expect_run 1 cat "$WORK/t.dbf" --dialect 10 && expect_err "zqdb: Error opening data file"
# A header cut short inside its field descriptors.
head -c 50 "$WORK/t.dbf" >"$WORK/cut.dbf"
expect_run 1 cat "$WORK/cut.dbf" && expect_err "zqdb: "
# Nothing on stdout for a table that can't be opened.
expect_run 1 cat "$WORK/missing.dbf" --format table
[ -s "$OUT" ] && fail "output for a missing table: $(head -c 200 "$OUT")"

# Usage errors: status 2, "zqdb: ..." first.
expect_run 2 && expect_err "usage: zqdb"
expect_run 2 frobnicate "$WORK/t.dbf" && expect_err "zqdb: unknown command"
expect_run 2 cat && expect_err "zqdb: "
expect_run 2 cat "$WORK/t.dbf" "$WORK/t.dbf" && expect_err "zqdb: "
expect_run 2 cat "$WORK/t.dbf" --bogus && expect_err "zqdb: unknown option --bogus"
expect_run 2 --verbose cat "$WORK/t.dbf" && expect_err "zqdb: unknown option"
expect_run 2 cat "$WORK/t.dbf" --format xml && expect_err "zqdb: "
expect_run 2 cat "$WORK/t.dbf" --format && expect_err "zqdb: "
expect_run 2 cat "$WORK/t.dbf" --codepage 12345 && expect_err "zqdb: unknown code page"
expect_run 2 cat "$WORK/t.dbf" --codepage abc && expect_err "zqdb: unknown code page"
expect_run 2 cat "$WORK/t.dbf" --memo sometimes && expect_err "zqdb: "
for bad in 11 -1 "dBASE V" abc ""; do
  expect_run 2 cat "$WORK/t.dbf" --dialect "$bad" && expect_err "zqdb: "
done
# A usage error wins over a missing table: nothing is opened.
expect_run 2 cat "$WORK/missing.dbf" --format xml

expect_run 0 --help && expect_out "usage: zqdb"

finish
