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
# code page 850 ("Müller": M 0x81 l l e r). Built as dBASE III with fields
#   NAME C(8)  AMT N(7,2)  BORN D  OK L   (record length 1+8+7+8+1 = 25)
{
  printf '\x03\x7c\x01\x01\x03\x00\x00\x00\xa1\x00\x19\x00'   # 3 records, header 161, record 25
  printf '\x00%.0s' {1..20}
  for f in 'NAME C\x08\x00' 'AMT  N\x07\x02' 'BORN D\x08\x00' 'OK   L\x01\x00'; do
    name=${f%% *}; rest=${f#* }; rest=${rest# }; rest=${rest# }; rest=${rest# }
    printf '%s' "$name"; printf '\x00%.0s' $(seq $((11 - ${#name})))
    printf "${rest:0:1}\x00\x00\x00\x00${rest:1}"
    printf '\x00%.0s' {1..14}
  done
  printf '\x0d'
  printf ' M\x81ller    12.5020240229T'
  printf '*deleted    1.0019990101F'
  printf ' a, "b"  '; printf ' %.0s' {1..15}; printf '?'
  printf '\x1a'
} >"$WORK/all.dbf"
expect_run 0 info "$WORK/all.dbf"
expect_out "records:     3 in the header, 2 live"
expect_out "  2    AMT         N        7    2"
expect_out "  3    BORN        D        8    0"
expect_out "  4    OK          L        1    0"

check_output() {  # check_output FORMAT < EXPECTED: cat's output is exactly EXPECTED
  cat >"$WORK/want"
  "$ZQDB" cat "$WORK/all.dbf" --codepage 850 --format "$1" >"$OUT" 2>"$ERR"
  if cmp -s "$OUT" "$WORK/want"; then PASSED=$((PASSED + 1))
  else fail "cat --format $1:"; diff "$WORK/want" "$OUT" | head -10; fi
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
  if cmp -s "$WORK/all.$f" "$WORK/want"; then PASSED=$((PASSED + 1)); else fail "convert to .$f differs from cat"; fi
done

finish
