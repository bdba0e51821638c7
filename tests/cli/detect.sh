#!/bin/bash
# Without --dialect the version byte (and, for 0x8B, the memo file's form)
# picks the dialect: tables written in every dialect read back as written.
source "$(dirname "$0")/lib.bash" "$1"

long=$(head -c 300 /dev/zero | tr '\0' 'm')
printf 'NAME,NOTE\nann,%s\nbob,short\n' "$long" >"$WORK/in.csv"
for d in 0 1 2 3 4 6 7 8 9; do
  expect_run 0 convert "$WORK/in.csv" "$WORK/t$d.dbf" --to "$d" --no-progress
  want=$long
  case $d in 0 | 3) want=${long:0:255} ;; esac  # no memo fields: folded to C(255)
  expect_run 0 cat "$WORK/t$d.dbf" --format csv && expect_out "ann,$want"
done
# Enable OA and dBASE IV share the byte 0x8B; the memo file tells them apart.
expect_run 0 info "$WORK/t7.dbf" && expect_out "dialect:     7 (Enable OA (Database))"
expect_run 0 info "$WORK/t2.dbf" && expect_out "dialect:     2 (dBASE IV)"
expect_run 0 info "$WORK/t9.dbf" && expect_out "version:     0x8B"
finish
