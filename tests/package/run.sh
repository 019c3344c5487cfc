#!/usr/bin/env bash
# Installs the build tree into a scratch prefix, then configures, builds and
# runs a consumer project against it with find_package(lumo) and pkg-config.
set -euo pipefail
BUILD_DIR="$1"
SOURCE_DIR="$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)"
WORK="$(mktemp -d)"
trap 'rm -rf "$WORK"' EXIT
cmake --install "$BUILD_DIR" --prefix "$WORK/prefix" >/dev/null
cmake -S "$SOURCE_DIR" -B "$WORK/build" -DCMAKE_PREFIX_PATH="$WORK/prefix" >/dev/null
cmake --build "$WORK/build" >/dev/null
LD_LIBRARY_PATH="$WORK/prefix/lib:$WORK/prefix/lib64:${LD_LIBRARY_PATH:-}" "$WORK/build/consumer"
PKG_CONFIG_PATH="$(dirname "$(find "$WORK/prefix" -name lumo.pc)")"
export PKG_CONFIG_PATH
# shellcheck disable=SC2046
c++ -std=c++17 "$SOURCE_DIR/consumer.cpp" -o "$WORK/consumer_pc" $(pkg-config --cflags --libs lumo)
LD_LIBRARY_PATH="$WORK/prefix/lib:$WORK/prefix/lib64:${LD_LIBRARY_PATH:-}" "$WORK/consumer_pc"
