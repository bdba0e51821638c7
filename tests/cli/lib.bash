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

# make_table PATH [VERSION_BYTE_HEX]: a dBASE III table (version 03 unless
# given) with NAME C(10) and QTY N(5,0); two records, the second deleted.
#   header: 03 | date 7C 01 01 | count 2 | header length 97 | record length 16
make_table() {
  local v=${2:-03}
  {
    printf "\x$v\x7c\x01\x01\x02\x00\x00\x00\x61\x00\x10\x00"
    printf '\x00%.0s' {1..20}
    printf 'NAME\x00\x00\x00\x00\x00\x00\x00C\x00\x00\x00\x00\x0a\x00'
    printf '\x00%.0s' {1..14}
    printf 'QTY\x00\x00\x00\x00\x00\x00\x00\x00N\x00\x00\x00\x00\x05\x00'
    printf '\x00%.0s' {1..14}
    printf '\x0d'
    printf ' alice        42'
    printf '*bob           7'
    printf '\x1a'
  } >"$1"
}

finish() {
  echo "$(basename "$0" .sh): $PASSED passed, $FAILED failed"
  [ "$FAILED" -eq 0 ]
}
