#!/usr/bin/env bash
# Sets everything up, builds lumo and runs the demo on the bundled samples.
set -euo pipefail
ROOT="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
bash "$ROOT/scripts/setup.sh"
bash "$ROOT/scripts/build.sh" -DLUMO_BUILD_TESTS=OFF -DLUMO_BUILD_BENCH=OFF
"$ROOT/build/tools/lumo" demo
