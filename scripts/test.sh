#!/usr/bin/env bash
# Sets everything up, builds lumo with tests and benchmarks, runs the whole
# suite, then builds and runs it once more under AddressSanitizer and
# UndefinedBehaviorSanitizer.
set -euo pipefail
ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
JOBS="$(nproc)"
bash "$ROOT/scripts/setup.sh"

echo "== build (Release) =="
cmake -S "$ROOT" -B "$ROOT/build" -DCMAKE_BUILD_TYPE=Release >/dev/null
cmake --build "$ROOT/build" -j"$JOBS"
echo "== tests (Release) =="
ctest --test-dir "$ROOT/build" --output-on-failure -j"$JOBS"

echo "== build (AddressSanitizer + UndefinedBehaviorSanitizer) =="
cmake -S "$ROOT" -B "$ROOT/build-sanitize" -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DLUMO_SANITIZE=ON -DLUMO_BUILD_BENCH=OFF >/dev/null
cmake --build "$ROOT/build-sanitize" -j"$JOBS"
echo "== tests (sanitizers) =="
ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  ctest --test-dir "$ROOT/build-sanitize" --output-on-failure -j"$JOBS"

echo "== size of code and tests =="
bash "$ROOT/scripts/count_lines.sh"
