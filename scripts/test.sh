#!/usr/bin/env bash
# Builds everything and runs every test: the release build's suite, and the fuzz targets briefly (with clang).
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/setup.sh
jobs=$(nproc)

if command -v clang++ >/dev/null 2>&1; then
  cmake --preset fuzz >/dev/null
  cmake --build --preset fuzz -j "$jobs"
  ctest --preset fuzz
else
  echo "test: clang++ not found, fuzz targets not built"
fi

cmake --preset release >/dev/null
cmake --build --preset release -j "$jobs"
ctest --preset release -j "$jobs"
