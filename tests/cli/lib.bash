# Shared helpers of the CLI tests (sourced, not run by itself).
#   source "$(dirname "$0")/lib.bash" "$1"
# sets ZQDB (an absolute path) and WORK (a temporary directory removed on
# exit), and gives expect_run, expect_out, expect_err, err_has, same,
# same_file, absent, make_table and finish.

ZQDB=${1:?usage: bash test.sh PATH_TO_ZQDB}
case $ZQDB in /*) ;; *) ZQDB=$PWD/$ZQDB ;; esac
WORK=$(mktemp -d "${TMPDIR:-/tmp}/zqdb-cli-XXXXXX")
trap 'rm -rf "$WORK"' EXIT
PASSED=0
FAILED=0
OUT=$WORK/out
ERR=$WORK/err

fail() { echo "FAIL $*"; FAILED=$((FAILED + 1)); }

# expect_run STATUS ARGS...: runs zqdb with ARGS; passes when it exits STATUS.
expect_run() {
  local want=$1; shift
  "$ZQDB" "$@" >"$OUT" 2>"$ERR"
  local rc=$?
  if [ "$rc" -eq "$want" ]; then PASSED=$((PASSED + 1)); return 0; fi
  fail "zqdb $*: exit $rc, expected $want; stderr: $(head -c 300 "$ERR")"
  return 1
}

# expect_out TEXT: the last run's stdout holds TEXT (a fixed string).
expect_out() {
  if grep -qF -- "$1" "$OUT"; then PASSED=$((PASSED + 1)); else fail "stdout lacks '$1': $(head -c 400 "$OUT")"; fi
}

# expect_err TEXT: the last run's stderr holds TEXT as its first line's start.
expect_err() {
  if head -n 1 "$ERR" | grep -qF -- "$1"; then PASSED=$((PASSED + 1)); else fail "stderr lacks '$1': $(head -c 300 "$ERR")"; fi
}

# err_has TEXT: a line of the last run's stderr holds TEXT.
err_has() {
  if grep -qF -- "$1" "$ERR"; then PASSED=$((PASSED + 1)); else fail "stderr lacks '$1': $(head -c 400 "$ERR")"; fi
}
# same WHAT GOT WANT: two texts are equal.
same() {
  if [ "$2" = "$3" ]; then PASSED=$((PASSED + 1)); else fail "$1: got '$2', expected '$3'"; fi
}
# same_file FILE COPY: FILE holds the bytes of COPY.
same_file() {
  if cmp -s "$1" "$2"; then PASSED=$((PASSED + 1)); else fail "$1 differs from $2"; fi
}
# absent PATH...: none of the files exists.
absent() {
  local p
  for p in "$@"; do
    if [ -e "$p" ]; then fail "$p was left behind"; else PASSED=$((PASSED + 1)); fi
  done
}

# ok WHAT COMMAND...: passes when COMMAND succeeds (`not COMMAND` when it fails).
ok() { local what=$1; shift; if "$@"; then PASSED=$((PASSED + 1)); else fail "$what"; fi; }
not() { ! "$@"; }
# out_is < TEXT: the last run's stdout is TEXT, the CRs of CSV line ends aside.
out_is() {
  if cmp -s - <(tr -d '\r' <"$OUT"); then PASSED=$((PASSED + 1)); else fail "stdout: $(head -c 300 "$OUT")"; fi
}

# Table bytes. bytes N...: a byte of each number; zeros N: N NUL bytes; le16 N:
# two bytes, the low one first; patch FILE OFFSET BYTES: BYTES (printf escapes)
# written over FILE at OFFSET.
bytes() { local b h; for b in "$@"; do printf -v h %02x "$b"; printf "\\x$h"; done; }
zeros() { local p; printf -v p '%*s' "$1" ''; printf "${p// /\\x00}"; }
le16() { bytes $(($1 & 255)) $(($1 >> 8)); }
patch() { printf "$3" | dd of="$1" bs=1 seek="$2" conv=notrunc 2>/dev/null; }
# dbf_header VERSION RECORDS HEADER_LENGTH RECORD_LENGTH: a table's first 32
# bytes, VERSION in hex, dated 1924-01-01 (7C 01 01).
dbf_header() { printf "\x$1\x7c\x01\x01"; le16 "$2"; zeros 2; le16 "$3"; le16 "$4"; zeros 20; }
# field NAME TYPE WIDTH [DECIMALS]: a 32-byte field descriptor.
field() { printf '%s' "$1"; zeros $((11 - ${#1})); printf '%s' "$2"; zeros 4; bytes "$3" "${4:-0}"; zeros 14; }
# make_table PATH [VERSION]: a dBASE III table (version 03 unless given) with
# NAME C(10) and QTY N(5,0); two records, the second deleted.
make_table() {
  { dbf_header "${2:-03}" 2 97 16; field NAME C 10; field QTY N 5
    printf '\r alice        42*bob           7\x1a'; } >"$1"
}

finish() {
  echo "$(basename "$0" .sh): $PASSED passed, $FAILED failed"
  [ "$FAILED" -eq 0 ]
}
