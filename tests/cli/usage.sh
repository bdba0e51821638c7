# Help and version, unknown options, errors with their reasons, gathered
# warnings with --quiet and --strict, info --format json, --fields.
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1
make_table t.dbf

# --- Help and version ---------------------------------------------------------
starts() { same "stdout's start" "$(head -c ${#1} "$OUT")" "$1"; }  # starts TEXT
expect_run 0 --version && starts "zqdb 0.1.0" && expect_out "connector definitions"
expect_run 0 help && starts "usage: zqdb COMMAND [options] FILE..." && expect_out "  convert SRC DST"
for cmd in info cat convert keys formats; do
  expect_run 0 help $cmd && starts "usage: zqdb $cmd" && expect_out "examples:"
  expect_run 0 $cmd --help && starts "usage: zqdb $cmd"
done
expect_run 2 help nosuch
# Options a command doesn't take, and values it doesn't take.
expect_run 2 info t.dbf --format jsonl && expect_err "zqdb: info --format takes text or json, not jsonl"
expect_run 2 info t.dbf --mode append && expect_err "zqdb: info takes no option --mode"
expect_run 2 convert t.dbf x.csv --to foxpro && expect_err "zqdb: --to goes with a table target, not csv"
expect_run 2 convert t.dbf x.dbf --format nosuch && expect_err "zqdb: convert --format takes"
absent x.csv x.dbf

# --- Errors say why -----------------------------------------------------------
: >empty.dbf
{ printf 'PK\003\004'; head -c 60 /dev/zero; } >zip.dbf
head -c 40 t.dbf >short.dbf
mkdir dir.dbf
cp t.dbf locked.dbf && chmod 000 locked.dbf
while IFS='|' read -r file why; do
  expect_run 1 info "$file" && expect_err "zqdb: Error opening data file $file: $why"
done <<'X'
missing.dbf|No such file or directory
dir.dbf|is a directory
empty.dbf|empty file
zip.dbf|not a table (version byte 0x50)
short.dbf|cut short: the header says 97 bytes, the file has 40
X
if [ "$(id -u)" != 0 ]; then
  expect_run 1 cat locked.dbf && expect_err "locked.dbf: Permission denied"
fi
# info on a damaged table prints what its header says, then the error.
expect_run 1 info short.dbf && expect_out "records:     2 in the header" && expect_err "cut short"
# A memo error names the memo file.
{ dbf_header 83 1 65 11; field NOTE M 10; printf '\r          1\x1a'; } >memo.dbf
expect_run 1 cat memo.dbf && expect_err "(memo.dbt, a dBASE III memo file: No such file or directory)"
# --memo errors reads on without the memo file and counts what it left blank.
expect_run 0 cat memo.dbf --memo errors && expect_err "zqdb: warning: 1 memo was left blank under --memo errors (the first: record 1, NOTE): memo.dbt, a dBASE III memo file, could not be read: No such file or directory"

# --- Warnings: one line a kind, --quiet, --strict -----------------------------
printf 'id,name,qty\n1,ann,2\n' >lower.csv
expect_run 0 convert lower.csv up.dbf
expect_err "zqdb: warning: 3 field names were upper-cased (id -> ID, name -> NAME, qty -> QTY)"
ok "more than one warning line: $(cat "$ERR")" test "$(wc -l <"$ERR")" -eq 1
expect_run 0 convert lower.csv up2.dbf --quiet
ok "--quiet warned: $(cat "$ERR")" not test -s "$ERR"
expect_run 1 convert lower.csv up3.dbf --strict && expect_err "zqdb: error (--strict): 3 field names were upper-cased"
absent up3.dbf
# A value cut on the way stops the run at its record under --strict.
printf 'NAME\nalice\nbernadette-marie\n' >long.csv
expect_run 1 convert long.csv cut.dbf --schema "NAME C(5)" --strict
expect_err "zqdb: record 2, field NAME: \"bernadette-marie\" would be cut to 5 bytes (--strict)"
absent cut.dbf

# --- info --format json -------------------------------------------------------
# json_holds WHAT EXPR: EXPR, a Python expression over the last run's JSON `d`, holds.
json_holds() {
  /usr/bin/python3 -c 'import json, sys; d = json.load(open(sys.argv[1])); sys.exit(0 if eval("(" + sys.argv[2] + ")") else "%r" % d)' \
    "$OUT" "$2" && PASSED=$((PASSED + 1)) || fail "$1"
}
expect_run 0 info t.dbf --format json
json_holds "info json" 'd == dict(d, dialect=2, dialect_name="dBASE IV", version_byte=3, codepage_byte=0,
  production_index=False, records_in_header=2, records_live=1, header_length=97, record_length=16, memo=None,
  fields=[{"name": "NAME", "type": "C", "width": 10, "decimals": 0},
          {"name": "QTY", "type": "N", "width": 5, "decimals": 0}], indexes=[])'
expect_run 0 convert t.dbf ix.dbf --index BYNAME=NAME --to 2
expect_run 0 info ix.dbf --format json
json_holds "info json indexes" '[d["indexes"][0][k] for k in ("name", "expression", "unique")] == ["BYNAME", "NAME", False]
  and d["indexes"][0]["file"].lower().endswith("ix.mdx") and d["production_index"] is True'
printf 'NAME,NOTE\nann,hello\n' >notes.csv
expect_run 0 convert notes.csv memo4.dbf --schema "NOTE M" && expect_run 0 info memo4.dbf --format json
json_holds "info json memo" 'd["memo"]["file"].endswith("memo4.dbt") and d["memo"]["kind"] == "dBASE IV"
  and d["memo"]["block_size"] == 512'
expect_run 1 info short.dbf --format json
json_holds "info json of a damaged table" 'd["records_in_header"] == 2 and "cut short" in d["error"]'

# --- --fields -----------------------------------------------------------------
expect_run 0 cat t.dbf --fields qty,NAME && expect_out "QTY,NAME" && expect_out "42,alice"
expect_run 0 convert t.dbf f.jsonl --fields QTY
same "convert --fields" "$(cat f.jsonl)" '{"QTY":42}'
# A field named twice feeds both columns: its value is copied, not moved on.
expect_run 0 convert t.dbf twice.csv --fields NAME,NAME,QTY --quiet
same "--fields NAME,NAME" "$(tail -1 twice.csv | tr -d "\r")" "alice,alice,42"
expect_run 2 cat t.dbf --fields NAME,COLOR && expect_err "zqdb: --fields: no field COLOR; the fields are NAME, QTY"
expect_run 2 convert t.dbf g.csv --fields COLOR && expect_err "zqdb: --fields: no field COLOR"
absent g.csv

finish
