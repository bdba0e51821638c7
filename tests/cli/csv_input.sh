# CSV input without guessing: codes with leading zeros or more than 15 digits
# stay text, --no-infer reads every column as text, ';' and tab are found
# when the header has no comma, --delimiter and --csv-codepage say what the
# file is; text up to 255 bytes stays C.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# fields_of TABLE: the "name type width" lines of info
fields_of() { "$ZQDB" info "$1" | sed -n 's/^  [0-9]* *\([A-Z_0-9]*\) *\([A-Z]\) *\([0-9]*\) .*/\1 \2 \3/p' | tr '\n' ' '; }

printf 'zip,phone,id,qty,amount,big\n01234,0049301234,1,5,-0.50,1234567890123456\n10115,4930123,2,0,12.25,7\n' >z.csv
expect_run 0 convert z.csv z.dbf
same "inferred types" "$(fields_of z.dbf)" "ZIP C 5 PHONE C 10 ID N 1 QTY N 1 AMOUNT N 6 BIG C 16 "
expect_run 0 cat z.dbf && expect_out "01234,0049301234,1,5,-0.50,1234567890123456"
expect_run 0 convert z.csv all.dbf --no-infer
same "--no-infer" "$(fields_of all.dbf)" "ZIP C 5 PHONE C 10 ID C 1 QTY C 1 AMOUNT C 5 BIG C 16 "
# A schema still types the columns it names.
expect_run 0 convert z.csv some.dbf --no-infer --schema "QTY N(3)"
same "--no-infer with a schema" "$(fields_of some.dbf)" "ZIP C 5 PHONE C 10 ID C 1 QTY N 3 AMOUNT C 5 BIG C 16 "

# Delimiters: found in a header without commas, or given.
printf 'a;b;c\n1;x y;2,5\n' >semi.csv
expect_run 0 convert semi.csv - && same "semicolons" "$(tr -d '\r' <"$OUT")" 'a,b,c
1,x y,"2,5"'
printf 'a\tb\n1\tx;y\n' >tab.csv
expect_run 0 convert tab.csv - --format jsonl && same "tabs" "$(cat "$OUT")" '{"a":1,"b":"x;y"}'
printf 'a|b\n1|2\n' >pipe.csv
expect_run 0 convert pipe.csv - --delimiter '|' && same "--delimiter" "$(tr -d '\r' <"$OUT")" 'a,b
1,2'
expect_run 0 convert tab.csv - --delimiter tab
expect_run 2 convert pipe.csv - --delimiter '||' && expect_err "zqdb: --delimiter takes one character"

# The CSV's own code page.
printf 'name\nM\xfcller\n' >latin.csv
expect_run 0 convert latin.csv - --csv-codepage 1252 && expect_out "Müller"
expect_run 0 convert latin.csv l850.dbf --csv-codepage windows-1252 --to-codepage 850
same "1252 CSV to an 850 table" "$(od -An -tx1 -j 67 -N 6 l850.dbf | tr -d ' ')" "4d816c6c6572"

# Text of 255 bytes stays C(255); of 256 it becomes a memo.
t255=$(head -c 255 /dev/zero | tr '\0' 'x')
printf 'T\n%s\n' "$t255" >t255.csv
expect_run 0 convert t255.csv t255.dbf && same "255 bytes" "$(fields_of t255.dbf)" "T C 255 "
printf 'T\n%sx\n' "$t255" >t256.csv
expect_run 0 convert t256.csv t256.dbf && same "256 bytes" "$(fields_of t256.dbf)" "T M 10 "
# A table's C(255) copied stays C(255), in a dialect without memos too.
expect_run 0 convert t255.dbf copy0.dbf --to 0 && same "C(255) to dBASE II" "$(fields_of copy0.dbf)" "T C 255 "
expect_run 0 cat copy0.dbf && expect_out "$t255"
finish
