# Writes that nothing breaks: damaged targets, killed runs, a second writer,
# targets that alias the source, a full disk, moves into place, permissions,
# output errors. Each group checks the exit status, the message and the
# files before and after, byte for byte.
source "$(dirname "$0")/lib.bash" "$1"
REGRESS=$(cd "$(dirname "$0")/../regress" && pwd)
cd "$WORK" || exit 1
make_table src.dbf

# --- A damaged target is refused, never a crash --------------------------------
# reclen0.dbf: src.dbf with the record length at offset 10 set to 0 (an
# append to it once wrote memset of reclen - 1 bytes). Fields that run past
# the record length are refused the same way.
cp "$REGRESS/reclen0.dbf" t0.dbf
make_table short.dbf && patch short.dbf 10 '\x08'
for t in "t0:The header gives a record length of 0" "short:Field 0 extends beyond end of record"; do
  message=${t#*:} t=${t%%:*}
  cp $t.dbf $t.before
  for mode in "append" "update --key NAME"; do
    # shellcheck disable=SC2086
    expect_run 1 convert src.dbf $t.dbf --mode $mode && expect_err "zqdb: $message"
    same_file $t.dbf $t.before
  done
done

# --- Killed runs ---------------------------------------------------------------
# kill_when CONDITION ARGS...: runs zqdb ARGS in the background and kills it
# with SIGKILL as soon as the shell test CONDITION holds.
kill_when() {
  local cond=$1; shift
  "$ZQDB" "$@" --no-progress >/dev/null 2>&1 &
  local pid=$!
  until eval "$cond" || ! kill -0 $pid 2>/dev/null; do :; done
  kill -9 $pid 2>/dev/null
  { wait $pid; } 2>/dev/null
  same "exit status of zqdb $* (137: killed)" $? 137
}
size() { stat -c %s "$1" 2>/dev/null || echo 0; }
# A run long enough to be caught mid-way: a million records of 16 bytes, a
# fifth of that under the sanitizers, where zqdb runs some ten times slower.
ROWS=999999 HALF=8000000
if [ -n "${ASAN_OPTIONS:-}" ]; then ROWS=199999 HALF=1600000; fi
seq 0 $ROWS | awk 'BEGIN { print "NAME,QTY" } { print "n" $1 "," $1 % 99999 }' >big.csv
printf 'NAME,QTY\nann,1\nbob,2\n' >two.csv
SCHEMA="NAME C(10), QTY N(5)"
expect_run 0 convert big.csv big.dbf --schema "$SCHEMA" --no-progress
expect_run 0 convert two.csv base.dbf --schema "$SCHEMA"
# What an append of two.csv to base.dbf makes when nothing interrupts it.
cp base.dbf clean.dbf && expect_run 0 convert two.csv clean.dbf --mode append
# Killed early, and half-way through: the header still counts 2
# records; the next append writes from there and the table ends at its end
# mark, byte for byte what an uninterrupted append makes.
for at in 200 $HALF; do
  cp base.dbf t.dbf
  kill_when "[ \$(size t.dbf) -gt $at ]" convert big.dbf t.dbf --mode append
  expect_run 0 convert two.csv t.dbf --mode append
  same_file t.dbf clean.dbf
done
# A killed replace leaves the old table as it was and its scratch directory,
# named by its process id; the next run into that directory removes it.
for at in 0 $HALF; do
  cp base.dbf r.dbf
  kill_when "[ \$(size .zqdb-*/r.dbf) -gt $at ]" convert big.dbf r.dbf
  same_file r.dbf base.dbf
  ok "no scratch directory of the killed run" ls -d .zqdb-[0-9]*-* >/dev/null 2>&1
  expect_run 0 convert two.csv other.dbf
  absent .zqdb-*
done

# A killed update: the records it overwrote come back from its journal when
# the table is next opened, here by a reader, which says so.
seq 0 $ROWS | awk 'BEGIN { print "NAME,QTY" } { print "n" $1 "," ($1 + 7) % 99999 }' >changed.csv
cp big.dbf u.dbf
kill_when "[ \$(size .zqdb-*-journal-u.dbf) -gt 100000 ]" convert changed.csv u.dbf --mode update --key NAME
expect_run 0 info u.dbf && err_has "zqdb: warning: u.dbf was restored to what it was before a run that was interrupted"
same_file u.dbf big.dbf
absent .zqdb-*

# A killed run into a new SQLite database leaves nothing under its name (the
# next run removes the scratch file); one killed while adding to an existing
# database leaves the rows it had, to SQLite's own journal, and nothing else.
# SQLite holds a transaction's pages in memory until it commits, so these runs
# are caught by how much of the table they have read (an append reads it once
# to check every value, then again to write): half-way through, never after
# the commit.
read_over() { [ "$(awk '/^rchar/ { print $2 }' /proc/$pid/io 2>/dev/null || echo 0)" -gt "$1" ]; }
kill_when "read_over $HALF" convert big.dbf k.sqlite
absent k.sqlite
expect_run 0 convert two.csv k.sqlite --table big && absent k.sqlite.zqdb-part
kill_when "read_over $(($(size big.dbf) + HALF))" convert big.dbf k.sqlite --mode append
same "rows of k.sqlite after a killed append" "$(sqlite3 k.sqlite 'SELECT count(*) FROM big')" 2
absent .zqdb-*

# --- A second writer -------------------------------------------------------------
# The shell holds the table's lock as another zqdb would (flock on the table).
cp base.dbf l.dbf && cp l.dbf l.before
exec 9<l.dbf
flock -x 9
expect_run 1 convert two.csv l.dbf --mode append && expect_err "zqdb: l.dbf is in use by another program (--wait waits for it)"
expect_run 1 cat l.dbf && expect_err "zqdb: l.dbf is being written by another program (--wait waits for it)"
same_file l.dbf l.before
flock -s 9  # a reader: other readers go on, writers don't
expect_run 0 cat l.dbf
expect_run 1 convert two.csv l.dbf --mode update --key NAME && expect_err "zqdb: l.dbf is in use by another program"
same_file l.dbf l.before
# --wait: the append waits for the lock and then runs.
"$ZQDB" convert two.csv l.dbf --mode append --wait >/dev/null 2>&1 &
waiter=$!
sleep 0.2
same_file l.dbf l.before
flock -u 9
ok "the waiting append failed" wait $waiter
same_file l.dbf clean.dbf
exec 9<&-
# Two appends of all the records at once, both waiting: none is lost.
cp base.dbf l.dbf
"$ZQDB" convert big.dbf l.dbf --mode append --wait --no-progress 2>/dev/null & first=$!
"$ZQDB" convert big.dbf l.dbf --mode append --wait --no-progress 2>/dev/null & second=$!
ok "the first concurrent append failed" wait $first
ok "the second concurrent append failed" wait $second
ALL=$((2 * (ROWS + 1) + 2))
expect_run 0 info l.dbf && expect_out "records:     $ALL in the header, $ALL live"
# Two appends to a table that doesn't exist yet: whichever way they meet, no
# run's records are lost without a word (one makes it, the other adds to it
# or adds nothing and says so).
"$ZQDB" convert big.dbf new.dbf --mode append --no-progress 2>new1.err & first=$!
"$ZQDB" convert big.dbf new.dbf --mode append --no-progress 2>new2.err & second=$!
made=0
wait $first && made=$((made + 1))
wait $second && made=$((made + 1))
[ $made = 2 ] || grep -q "new.dbf was made by another program while this run wrote it; nothing was added" new1.err new2.err ||
  fail "a failed append said: $(cat new1.err new2.err)"
expect_run 0 info new.dbf && expect_out "records:     $((made * (ROWS + 1))) in the header"

# --- A full disk -----------------------------------------------------------------
# A table with a memo file and an MDX tag on a 1 MB tmpfs; appending or
# updating 9,000 memos fills it. The run fails with the reason, and the table,
# memo and index files are restored byte for byte.
if [ "$(id -u)" = 0 ] && mkdir full && mount -t tmpfs -o size=1m tmpfs full 2>/dev/null; then
  trap 'umount "$WORK/full"; rm -rf "$WORK"' EXIT
  seq 1 9000 | awk 'BEGIN { print "NAME,NOTE" } { print "n" $1 ",a new memo of record " $1 }' >memos.csv
  seq 1 20 | awk 'BEGIN { print "NAME,NOTE" } { print "n" $1 ",memo " $1 }' >memos20.csv
  expect_run 0 convert memos20.csv full/f.dbf --schema "NAME C(10), NOTE M" --index NAME=NAME
  for f in f.dbf f.dbt f.mdx; do cp full/$f $f.before; done
  for mode in "append" "update --key NAME"; do
    # shellcheck disable=SC2086
    expect_run 1 convert memos.csv full/f.dbf --mode $mode &&
      expect_err "zqdb: cannot write full/f." && err_has ": No space left on device (the table was left as it was before the run)"
    ok "the file that filled the disk is not named" grep -Eq "cannot write full/f\.(dbf|dbt|mdx):" "$ERR"
    for f in f.dbf f.dbt f.mdx; do same_file full/$f $f.before; done
    absent full/.zqdb-*
  done
else
  echo "safety: the full-disk test needs root to mount a small tmpfs: skipped"
fi

# --- Targets that alias the source ---------------------------------------------
# m.dbf with a memo file m.dbt; every name below would write over one of them.
printf 'NAME,NOTE\nann,first memo\n' >memo.csv
expect_run 0 convert memo.csv m.dbf --schema "NAME C(10), NOTE M"
cp m.dbf m.dbf.before && cp m.dbt m.dbt.before
ln m.dbf hard.dbf
for dst in m.dbf m.DBT m.dbt hard.dbf; do
  for mode in replace append; do
    expect_run 1 convert m.dbf "$dst" --mode $mode && err_has "would write over"
  done
done
expect_run 1 convert memo.csv memo.csv && expect_err "zqdb: the target memo.csv would write over memo.csv, the source; choose another name"
expect_run 1 convert m.dbf m.DBT && expect_err "zqdb: the target m.DBT would write over m.dbt, the source's memo file; choose another name"
expect_run 1 convert m.dbf o.dbf --index m.dbt=NAME && err_has "would write over m.dbt"
same_file m.dbf m.dbf.before
same_file m.dbt m.dbt.before
absent m.DBT o.dbf

# --- Moving into place, permissions -----------------------------------------------
# A destination that is a directory stops the move before any file is moved.
printf 'NAME\nold\n' >old.csv && "$ZQDB" convert old.csv d.dbf 2>/dev/null && cp d.dbf d.before
mkdir d.dbt
expect_run 1 convert memo.csv d.dbf --schema "NAME C(10), NOTE M" && expect_err "zqdb: cannot replace ./d.dbt: it is a directory"
same_file d.dbf d.before
ok "d.dbt is no longer an empty directory" rmdir d.dbt
absent .zqdb-*
# A replaced table keeps its mode; one the user may not write is refused in
# every mode (as another user when run as root, who may write anything).
cp m.dbf p.dbf && chmod 640 p.dbf
expect_run 0 convert memo.csv p.dbf --schema "NAME C(10), NOTE M"
same "the mode of p.dbf" "$(stat -c %a p.dbf)" 640
mkdir shared && chmod 777 shared && cp m.dbf m.dbt memo.csv shared/ && chmod 444 shared/m.dbf && cp shared/m.dbf ro.before
as_user=""
[ "$(id -u)" = 0 ] && as_user="setpriv --reuid=nobody --regid=nogroup --clear-groups" && chmod 755 "$WORK"
for mode in replace append; do
  $as_user "$ZQDB" convert shared/memo.csv shared/m.dbf --mode $mode >"$OUT" 2>"$ERR"
  same "exit status of a $mode of a read-only table" $? 1
  expect_err "zqdb: cannot write shared/m.dbf: Permission denied"
  same_file shared/m.dbf ro.before
done
# Index files the user may only read are still checked, walked and sought.
"$ZQDB" convert memo.csv shared/i.dbf --schema "NAME C(10), NOTE M" --index NAME=NAME --index shared/i.ndx=NAME 2>/dev/null
chmod 444 shared/i.*
for command in "check shared/i.dbf --index shared/i.ndx" "keys shared/i.dbf --index NAME --seek ann" "keys shared/i.dbf --index shared/i.ndx"; do
  # shellcheck disable=SC2086
  $as_user "$ZQDB" $command >"$OUT" 2>"$ERR" && grep -q "ann\|clean" "$OUT" && PASSED=$((PASSED + 1)) ||
    fail "zqdb $command on read-only files: $(cat "$ERR")"
done

# --- Output errors ------------------------------------------------------------------
for command in "info m.dbf" "info m.dbf --format json" "cat m.dbf" "formats" "--help" "help convert" "convert m.dbf -"; do
  # shellcheck disable=SC2086
  "$ZQDB" $command >/dev/full 2>"$ERR"
  same "exit status of zqdb $command >/dev/full" $? 1
  expect_err "zqdb: cannot write"
  err_has "No space left on device"
done

# --- Names at scale, limits ---------------------------------------------------------
# 512 equal column names and 20,000 distinct ones become names of a JSON line
# (a quadratic search of the names taken would take minutes here).
awk 'BEGIN { for (i = 1; i <= 512; i++) printf "a%s", (i < 512 ? "," : "\n"); for (i = 1; i <= 512; i++) printf "1%s", (i < 512 ? "," : "\n") }' >dup.csv
expect_run 0 convert dup.csv dup.jsonl && expect_err "zqdb: warning: 511 field names were changed (a -> a_2, a -> a_3"
ok "dup.jsonl lacks a_512" grep -q '"a_511":1,"a_512":1}' dup.jsonl
awk 'BEGIN { for (i = 1; i <= 20000; i++) printf "c%d%s", i, (i < 20000 ? "," : "\n"); for (i = 1; i <= 20000; i++) printf "%d%s", i, (i < 20000 ? "," : "\n") }' >wide.csv
expect_run 0 convert wide.csv wide.jsonl
ok "wide.jsonl lacks c20000" grep -q '"c20000":20000}' wide.jsonl
# A header counting 200,000,000 records of 16 bytes: those past 2 GiB are
# out of reach of 32-bit record positions, said in one warning.
make_table huge.dbf && patch huge.dbf 4 '\x00\xc2\xeb\x0b'
expect_run 0 info huge.dbf && expect_err "zqdb: warning: huge.dbf: 65782279 of its 200000000 records lie past 2 GiB, beyond the 32-bit record positions of the format, and can't be read"

finish
