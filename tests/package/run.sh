#!/usr/bin/env bash
# Installs the build tree into a scratch prefix, then configures, builds and
# runs a consumer project against it with find_package(lumo) and pkg-config.
set -euo pipefail
BUILD_DIR="$1"
SOURCE_DIR="$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)"
WORK="$(mktemp -d)"
trap 'rm -rf "$WORK"' EXIT
cmake --install "$BUILD_DIR" --prefix "$WORK/prefix" >/dev/null
# liblumo itself never depends on GDAL (only the optional lumo_gdal does).
LIBLUMO="$(find "$WORK/prefix" -name 'liblumo.so' | head -n 1)"
if readelf -d "$LIBLUMO" | grep -q 'NEEDED.*gdal'; then
  echo "liblumo depends on GDAL" >&2
  exit 1
fi
cmake -S "$SOURCE_DIR" -B "$WORK/build" -DCMAKE_PREFIX_PATH="$WORK/prefix" >/dev/null
cmake --build "$WORK/build" >/dev/null
LD_LIBRARY_PATH="$WORK/prefix/lib:$WORK/prefix/lib64:${LD_LIBRARY_PATH:-}" "$WORK/build/consumer"
if [[ -x "$WORK/build/consumer_gdal" ]]; then
  LD_LIBRARY_PATH="$WORK/prefix/lib:$WORK/prefix/lib64:${LD_LIBRARY_PATH:-}" "$WORK/build/consumer_gdal"
fi
PKG_CONFIG_PATH="$(dirname "$(find "$WORK/prefix" -name lumo.pc)")"
export PKG_CONFIG_PATH
# shellcheck disable=SC2046
c++ -std=c++17 "$SOURCE_DIR/consumer.cpp" -o "$WORK/consumer_pc" $(pkg-config --cflags --libs lumo)
LD_LIBRARY_PATH="$WORK/prefix/lib:$WORK/prefix/lib64:${LD_LIBRARY_PATH:-}" "$WORK/consumer_pc"
