#!/usr/bin/env bash
# Line and function coverage of the module (src/) by the whole test suite:
# a Debug build with gcov instrumentation, every test run, lcov's summary.
# Usage: coverage.sh [BUILD]   (needs lcov)
set -euo pipefail
build=${1:-build-cov}
here=$(cd "$(dirname "$0")/.." && pwd)
cmake -S "$here" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Debug -DZANTIFF_BENCH=OFF \
  -DCMAKE_C_FLAGS=--coverage -DCMAKE_CXX_FLAGS=--coverage \
  -DCMAKE_EXE_LINKER_FLAGS=--coverage -DCMAKE_SHARED_LINKER_FLAGS=--coverage >/dev/null
cmake --build "$build" -j "$(nproc)" >/dev/null
lcov --quiet --zerocounters --directory "$build"
ctest --test-dir "$build" -j "$(nproc)" >/dev/null || echo "coverage: some tests failed" >&2
lcov --quiet --capture --directory "$build" --output-file "$build/all.info" 2>/dev/null
lcov --quiet --extract "$build/all.info" "$here/src/*" --output-file "$build/src.info"
lcov --summary "$build/src.info" 2>&1 | grep -E "lines|functions"
