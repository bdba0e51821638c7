# What info reports, and cat's three output forms, on a table built byte by byte.
source "$(dirname "$0")/lib.bash" "$1"

make_table "$WORK/t.dbf"
expect_run 0 info "$WORK/t.dbf"
expect_out "table:       $WORK/t.dbf"
expect_out "dialect:     2 (dBASE IV)"
expect_out "version:     0x03"
expect_out "records:     2 in the header, 1 live"
expect_out "layout:      header 97 bytes, record 16 bytes"
expect_out "fields:      2"
expect_out "  1    NAME        C       10    0"
expect_out "  2    QTY         N        5    0"

# A table with every common type, two live records and one deleted, text in
# code page 850 ("Müller": M 0x81 l l e r).
{ dbf_header 03 3 161 25; field NAME C 8; field AMT N 7 2; field BORN D 8; field OK L 1
  printf '\r M\x81ller    12.5020240229T*deleted    1.0019990101F a, "b"%17s?\x1a' ''; } >"$WORK/all.dbf"
expect_run 0 info "$WORK/all.dbf"
expect_out "records:     3 in the header, 2 live"
expect_out "  2    AMT         N        7    2"
expect_out "  3    BORN        D        8    0"
expect_out "  4    OK          L        1    0"

check_output() {  # check_output FORMAT < EXPECTED: cat's output is exactly EXPECTED
  cat >"$WORK/want"
  "$ZQDB" cat "$WORK/all.dbf" --codepage 850 --format "$1" >"$OUT" 2>"$ERR"
  ok "cat --format $1: $(diff "$WORK/want" "$OUT" | head -10)" cmp -s "$OUT" "$WORK/want"
}
printf 'NAME,AMT,BORN,OK\r\nMüller,12.50,2024-02-29,true\r\n"a, ""b""",,,\r\n' | check_output csv
check_output jsonl <<'X'
{"NAME":"Müller","AMT":12.50,"BORN":"2024-02-29","OK":true}
{"NAME":"a, \"b\"","AMT":null,"BORN":null,"OK":null}
X
check_output table <<'X'
NAME      AMT      BORN        OK
--------  -------  ----------  -----
Müller    12.50    2024-02-29  true
a, "b"                         
X
# convert to .csv and .jsonl writes what cat prints.
for f in csv jsonl; do
  "$ZQDB" cat "$WORK/all.dbf" --codepage 850 --format $f >"$WORK/want"
  expect_run 0 convert "$WORK/all.dbf" "$WORK/all.$f" --codepage 850 --no-progress
  ok "convert to .$f differs from cat" cmp -s "$WORK/all.$f" "$WORK/want"
done

finish
