# Tables with more field descriptors than their dialect reads: read whole in
# a dialect that holds them when none was named, with one line saying so; a
# dialect named by the user reads what it reads, and a warning counts the
# rest.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# wide_table PATH N: a 0x03 table of N fields F1..FN, C(1), one record whose
# field i holds the last digit of i.
wide_table() {
  local n=$2 i
  { dbf_header 03 1 $((32 + 32 * n + 1)) $((n + 1))
    for ((i = 1; i <= n; i++)); do field "F$i" C 1; done
    printf '\r '; for ((i = 1; i <= n; i++)); do printf '%d' $((i % 10)); done; printf '\x1a'; } >"$1"
}

wide_table w300.dbf 300
expect_run 0 info w300.dbf && expect_out "fields:      300" && expect_out "dialect:     9 (Visual dBASE 5.5)"
expect_err "zqdb: warning: w300.dbf has 300 fields, more than dBASE IV reads (256): read as Visual dBASE 5.5"
expect_run 0 cat w300.dbf --format jsonl && expect_out '"F256":"6","F257":"7"' && expect_out '"F300":"0"}'
# Records added to it fill every field, not only the first 256.
expect_run 0 convert w300.dbf w300.dbf.csv && cp w300.dbf add300.dbf
expect_run 0 convert w300.dbf.csv add300.dbf --mode append && expect_run 0 cat add300.dbf --format jsonl &&
  [ "$(grep -c '"F300":"0"}' "$OUT")" = 2 ] && PASSED=$((PASSED + 1)) || fail "an appended record lost F257..F300"
# Named by the user: read as that dialect, the rest counted.
expect_run 0 info w300.dbf --dialect "dBASE IV" && expect_out "fields:      256"
expect_err "zqdb: warning: w300.dbf has 300 fields, more than dBASE IV reads (256): the last 44 are left out"
expect_run 0 info w300.dbf --dialect "dBASE III" && expect_out "fields:      128"
expect_err "zqdb: warning: w300.dbf has 300 fields, more than dBASE III reads (128): the last 172 are left out"
# Within the limit: no word.
wide_table w200.dbf 200
expect_run 0 info w200.dbf && expect_out "dialect:     2 (dBASE IV)"
ok "a warning for 200 fields: $(cat "$ERR")" not test -s "$ERR"

# Character fields longer than 255 bytes, their length's high byte in the
# decimals byte: NAME C(300) (0x2C + 0x01 * 256) and QTY N(3). Read whole
# when that reading adds up to the record length (1 + 300 + 3) and the
# plain one (1 + 44 + 3) doesn't; else the bytes are taken as they stand.
long_table() {  # long_table PATH RECLEN
  { dbf_header 03 1 97 "$2"; field NAME C 44 1; field QTY N 3; printf '\r '
    printf '%299s' '' | tr ' ' a; printf 'z 42\x1a'; } >"$1"
}
long_table long.dbf 304
expect_run 0 info long.dbf && expect_out "  1    NAME        C      300    0" && expect_out "  2    QTY         N        3    0"
expect_run 0 cat long.dbf && expect_out "az,42"
long_table plain.dbf 48
expect_run 0 info plain.dbf && expect_out "  1    NAME        C       44    1"
finish
