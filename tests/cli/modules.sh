#!/bin/bash
# The engine finds the module by its trailer, in a process of its own: the
# definitions it lists, a conversion through a definition picked by short
# name, and a damaged module beside it skipped with one warning.
source "$(dirname "$0")/lib.bash" "$1"

expect_run 0 formats && expect_out "DADBASE     dBASE IV" && expect_out "DAVFOXPRO   Visual FoxPro" &&
  expect_out "clipper   version=8" && expect_out "libzqdbse.so"

# A conversion through the FoxPro definition: the new table is a FoxPro one.
printf 'NAME,NOTE\nann,%s\n' "$(head -c 300 /dev/zero | tr '\0' 'x')" >"$WORK/in.csv"
expect_run 0 convert "$WORK/in.csv" "$WORK/fox.dbf" --type foxpro --no-progress
expect_run 0 info "$WORK/fox.dbf" && expect_out "dialect:     6 (FoxPro)" && expect_out "version:     0xF5" &&
  expect_out "fox.fpt (FoxPro"
# A table is read in the dialect of the definition: Visual FoxPro's refuses it.
expect_run 1 cat "$WORK/fox.dbf" --type vfoxpro && expect_err "zqdb: Error opening data file"
# --to wins over the dialect of the definition --type picks.
expect_run 0 convert "$WORK/in.csv" "$WORK/db4.dbf" --type vfoxpro --to 2 --no-progress &&
  "$ZQDB" info "$WORK/db4.dbf" >"$OUT" && expect_out "dialect:     2 (dBASE IV)"
expect_run 2 cat "$WORK/fox.dbf" --type nosuch && expect_err "no connector definition named nosuch"

# Modules in a directory of our own: a copy of the real one is found there, one
# whose trailer is damaged (a zero in its last 16 bytes) is skipped with a warning.
mkdir -p "$WORK/mods"
module=$(dirname "$ZQDB")/libzqdbse.so
cp "$module" "$WORK/mods/libgood.so"
{ head -c 2000 "$module"; tail -c 1212 "$module" | head -c 1196; zeros 4; tail -c 12 "$module"; } \
  >"$WORK/mods/libcut.so"
ZQDB_MODULE_PATH="$WORK/mods" expect_run 0 formats && expect_out "$WORK/mods/libgood.so" &&
  err_has "libcut.so is skipped"
expect_run 0 --modules "$WORK/mods" cat "$WORK/fox.dbf" --format jsonl && expect_out '"NAME":"ann"'
# A loadable library with a valid trailer but none of the factories it names
# (a second copy of the host library, which AddressSanitizer would report).
mkdir -p "$WORK/nofac"
{ cat "$(dirname "$ZQDB")/libzqhost.so"; tail -c 1212 "$module"; } >"$WORK/nofac/libnofac.so"
ASAN_OPTIONS=${ASAN_OPTIONS:+$ASAN_OPTIONS:}detect_odr_violation=0 expect_run 1 --modules "$WORK/nofac" cat "$WORK/fox.dbf" && expect_err "zqdb: $WORK/nofac/libnofac.so lacks the factories of Dbase"

# No module anywhere: a clear error, not a crash.
mkdir -p "$WORK/lonely"
cp "$ZQDB" "$WORK/lonely/zqdb"
out=$(cd "$WORK/lonely" && LD_LIBRARY_PATH=$(dirname "$ZQDB") ./zqdb info "$WORK/fox.dbf" 2>&1); rc=$?
ok "no module: exit $rc: $out" test "$rc" = 1 -a "${out/no connector module found/}" != "$out"
finish
