#!/bin/sh
# Assembles docs/behaviour.md from the per-subject notes in docs/notes/.
set -e
cd "$(dirname "$0")/.."
{
  echo "# How zqdbse settles what the formats leave open"
  echo
  echo "The table, memo and index formats of the dBASE family leave some cases open, and"
  echo "damaged files make more. Each section below says what this system does in such a"
  echo "case, why, and the test that shows it. The rule behind all of them: no data lost,"
  echo "no file left that other programs can't read, and bad input answered with a clear"
  echo "error, never a crash or a hang."
  for f in host read memo target vfp dbase_index fox_index check engine safeguards safety cli databases module; do
    [ -f "docs/notes/$f.md" ] || continue
    echo
    sed 's/^# /## /' "docs/notes/$f.md"
  done
} >docs/behaviour.md
