# NUL bytes and binary fields: character fields padded with NULs read like
# those padded with blanks, a field of NULs only is blank, and bytes that are
# no text (G fields, memos holding NULs) come out of CSV and JSON as base64,
# with one warning.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# NAME C(10) of record 1 "alice" and five NULs; record 2 made live, its NAME
# all NULs (records at 97 and 113, NAME one byte after the flag).
make_table t.dbf
patch t.dbf 103 '\0\0\0\0\0'
patch t.dbf 113 ' \0\0\0\0\0\0\0\0\0\0'
expect_run 0 cat t.dbf --format jsonl
same "NULs in JSON" "$(cat "$OUT")" '{"NAME":"alice","QTY":42}
{"NAME":null,"QTY":7}'
expect_run 0 cat t.dbf --format table && expect_out "alice  "
expect_run 0 convert t.dbf t2.dbf
same "NULs become blanks in a table" "$(od -An -tx1 -j 99 -N 10 t2.dbf | tr -d ' ')" "616c6963652020202020"

# A memo of bytes with NULs, and a G field (an M field whose type letter is
# then made G): base64 in CSV and JSON, one warning; text memos stay text.
printf 'ID,PIC,NOTE\n1,"GIF\0\1\2",plain\n2,"ab",x\0y\n' >b.csv
expect_run 0 convert b.csv b.dbf --schema "ID N(2), PIC M, NOTE M" --to foxpro
patch b.dbf 75 'G'    # the type letter of the second descriptor (32 + 32 + 11)
expect_run 0 cat b.dbf
same "binary in CSV" "$(tr -d '\r' <"$OUT")" "ID,PIC,NOTE
1,R0lGAAEC,plain
2,YWI=,eAB5"
expect_err "zqdb: warning: 3 binary values (PIC, NOTE) were written as base64"
ok "more than one warning: $(cat "$ERR")" test "$(wc -l <"$ERR")" -eq 1
expect_run 0 convert b.dbf b.jsonl
same "binary in JSON" "$(cat b.jsonl)" '{"ID":1,"PIC":"R0lGAAEC","NOTE":"plain"}
{"ID":2,"PIC":"YWI=","NOTE":"eAB5"}'
finish
