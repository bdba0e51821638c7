#!/bin/sh
# Prints the lines of the tests against the lines of the product, counting only lines
# that are neither blank nor comments: tests/ and fuzz/ against host/, table/,
# connector/, index/ and engine/ (zqdb's main included; tools/, bench/ and examples/
# left out, and so are seed files and CMake files).
# Usage: tools/test_ratio.sh [-v]   (-v lists each file's count first, largest last)
set -e
cd "$(dirname "$0")/.."

verbose=0
[ "${1:-}" = "-v" ] && verbose=1

sources() {
  find "$@" -type f \( -name '*.c' -o -name '*.cc' -o -name '*.cpp' -o -name '*.h' \
    -o -name '*.hpp' -o -name '*.sh' -o -name '*.bash' -o -name '*.py' \) | sort
}

# Prints "count path" for each file, then "total" alone. In C and C++ files `//` lines
# and `/* ... */` blocks are comments; in shell and Python files `#` lines are (the
# `#!` line too), and so are Python docstrings (a block that opens with three double
# quotes at the start of a line). A line with code before or after a comment counts
# as code.
count() {
  xargs awk '
    FNR == 1 { if (file != "") print n, file; file = FILENAME; n = 0; block = 0; doc = 0
               cxx = FILENAME ~ /\.(c|cc|cpp|h|hpp)$/; py = FILENAME ~ /\.py$/ }
    {
      s = $0; gsub(/^[ \t]+|[ \t\r]+$/, "", s)
      if (doc) { if (index(s, "\"\"\"")) doc = 0; next }
      if (py && substr(s, 1, 3) == "\"\"\"") { if (index(substr(s, 4), "\"\"\"") == 0) doc = 1; next }
      if (block) { if (index(s, "*/") == 0) next
                   block = 0; s = substr(s, index(s, "*/") + 2); gsub(/^[ \t]+/, "", s) }
      if (s == "") next
      if (cxx) {
        if (s ~ /^\/\//) next
        if (s ~ /^\/\*/) { if (index(s, "*/") == 0) { block = 1; next }
                           if (s ~ /\*\/[ \t]*$/) next }
      } else if (s ~ /^#/) next
      n++; total++
    }
    END { if (file != "") print n, file; print total + 0 }'
}

report() {  # report LABEL DIR...
  label=$1; shift
  out=$(sources "$@" | count)
  if [ "$verbose" = 1 ]; then echo "$out" | sed '$d' | sort -n | awk '{ printf "%7d %s\n", $1, $2 }' >&2; fi
  total=$(echo "$out" | tail -n 1)
  [ "$verbose" = 1 ] && printf "%7d %s\n\n" "$total" "$label" >&2
  echo "$total"
}

tests=$(report tests tests fuzz)
code=$(report code host table connector index engine)
awk -v t="$tests" -v c="$code" 'BEGIN { printf "tests %d lines, code %d lines: %.1f%%\n", t, c, 100 * t / c }'
