#!/bin/bash
# make bench: bench/run.sh BUILD_DIR/zqdb [SIZE...]
# Times zqdb's read to CSV against pgdbf and python3-dbfread on generated
# tables of 100,000, 1,000,000 and 4,000,000 records (kept in bench/data/),
# then convert (CSV and DBF to DBF) against ogr2ogr and python3-dbf, memo
# tables, converts that build an MDX or a CDX tag against sort and Perl XBase,
# and check and reindex of a memo table with one tag against cat.
set -e
if [ $# -lt 1 ] || [ ! -x "$1" ]; then
  echo "usage: bench/run.sh PATH_TO_ZQDB [SIZE...]" >&2
  exit 2
fi
/usr/bin/python3 "$(dirname "$0")/bench.py" "$@"
/usr/bin/python3 "$(dirname "$0")/bench_convert.py" "$1"
/usr/bin/python3 "$(dirname "$0")/bench_memo.py" "$1"
/usr/bin/python3 "$(dirname "$0")/bench_index.py" "$1"
/usr/bin/python3 "$(dirname "$0")/bench_databases.py" "$1"
/usr/bin/python3 "$(dirname "$0")/bench_check.py" "$1"
