#!/usr/bin/env bash
# Counts the project's C++ lines that are neither blank nor comments: code
# (include/, mathmodel/, host/, tools/) and tests (tests/, fixtures in
# tests/support/ included), and prints their ratio. Benchmarks, fuzz
# targets, scripts and examples count on neither side.
set -euo pipefail
ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"

# Non-blank lines outside // and /* */ comments of the C++ files below the
# given directories.
count() {
  local dirs=()
  for d in "$@"; do dirs+=("$ROOT/$d"); done
  find "${dirs[@]}" -type f \( -name '*.cpp' -o -name '*.h' \) -print0 |
    xargs -0 cat |
    awk '
      {
        line = $0
        gsub(/^[ \t]+|[ \t\r]+$/, "", line)
        if (inBlock) {
          end = index(line, "*/")
          if (end == 0) next
          inBlock = 0
          line = substr(line, end + 2)
          gsub(/^[ \t]+/, "", line)
        }
        if (line == "" || substr(line, 1, 2) == "//") next
        if (substr(line, 1, 2) == "/*") {
          end = index(substr(line, 3), "*/")
          if (end == 0) { inBlock = 1; next }
          rest = substr(line, end + 4)
          gsub(/^[ \t]+/, "", rest)
          if (rest == "" || substr(rest, 1, 2) == "//") next
        }
        n++
      }
      END { print n + 0 }'
}

code=$(count include mathmodel host tools)
tests=$(count tests)
awk -v c="$code" -v t="$tests" 'BEGIN {
  printf "code lines (include, mathmodel, host, tools): %d\n", c
  printf "test lines (tests):                          %d\n", t
  printf "tests / code:                                %.3f\n", (c > 0 ? t / c : 0)
}'
