#!/usr/bin/env bash
# Checks the README's test command on a scratch build folder left as
# scripts/demo.sh leaves build/ (tests and benchmarks off): running the suite
# there must fail because no test exists, and the command's configure step
# must switch the folder back to the whole suite.
set -euo pipefail
ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd)"
WORK="$(mktemp -d)"
trap 'rm -rf "$WORK"' EXIT
# shellcheck source=../../scripts/test.sh
source "$ROOT/scripts/test.sh"

cmake -S "$ROOT" -B "$WORK/build" -DCMAKE_BUILD_TYPE=Release -DLUMO_BUILD_TESTS=OFF \
  -DLUMO_BUILD_BENCH=OFF >/dev/null
if run_suite "$WORK/build" >"$WORK/ctest.log" 2>&1; then
  echo "FAIL: a build folder without tests passed the suite" >&2
  exit 1
fi

configure_suite "$WORK/build" Release OFF ON
for option in LUMO_BUILD_TESTS LUMO_BUILD_BENCH LUMO_BUILD_TOOLS; do
  if ! grep -q "^$option:BOOL=ON$" "$WORK/build/CMakeCache.txt"; then
    echo "FAIL: $option is not ON after the suite's configure" >&2
    exit 1
  fi
done
if ! ctest --test-dir "$WORK/build" -N | grep -q "Total Tests: [1-9]"; then
  echo "FAIL: the reconfigured folder registers no test" >&2
  exit 1
fi
echo "test command: reconfigures a demo build folder and refuses an empty suite"
