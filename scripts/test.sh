#!/usr/bin/env bash
# Sets everything up, builds lumo with tests and benchmarks, runs the whole
# suite, then builds and runs it once more under AddressSanitizer and
# UndefinedBehaviorSanitizer.
#
# Every option that decides what is built is given on each configure, so a
# build folder left by another command (scripts/demo.sh turns the tests off)
# is switched back to the whole suite; and a run in which no test was found
# fails instead of passing silently.
set -euo pipefail
ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
JOBS="$(nproc)"

# configure_suite DIR BUILD_TYPE SANITIZE BENCH: configures DIR for the
# whole test suite, whatever an earlier configure of DIR chose.
configure_suite() {
  cmake -S "$ROOT" -B "$1" -DCMAKE_BUILD_TYPE="$2" -DLUMO_BUILD_TESTS=ON \
    -DLUMO_BUILD_TOOLS=ON -DLUMO_BUILD_BENCH="$4" -DLUMO_SANITIZE="$3" -DLUMO_FUZZ=OFF >/dev/null
}

# run_suite DIR: runs every test of DIR; fails when there is none.
run_suite() {
  ctest --test-dir "$1" --output-on-failure --no-tests=error -j"$JOBS"
}

main() {
  bash "$ROOT/scripts/setup.sh"

  echo "== build (Release) =="
  configure_suite "$ROOT/build" Release OFF ON
  cmake --build "$ROOT/build" -j"$JOBS"
  echo "== tests (Release) =="
  run_suite "$ROOT/build"

  echo "== build (AddressSanitizer + UndefinedBehaviorSanitizer) =="
  configure_suite "$ROOT/build-sanitize" RelWithDebInfo ON OFF
  cmake --build "$ROOT/build-sanitize" -j"$JOBS"
  echo "== tests (sanitizers) =="
  ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
    run_suite "$ROOT/build-sanitize"

  echo "== size of code and tests =="
  bash "$ROOT/scripts/count_lines.sh"
}

# Sourced (by the test of this script) it only defines the functions.
if [[ "${BASH_SOURCE[0]}" == "$0" ]]; then
  main "$@"
fi
