#!/usr/bin/env bash
# Configures (once) and builds the sanitizer build into build-asan/ (or $CORV_ASAN_BUILD_DIR):
# clang at -O0 with AddressSanitizer, UBSan and libFuzzer's coverage, which the unit tests
# and the fuzz targets share so that the library is compiled once for both.
#   bash scripts/build-asan.sh [targets...]     (default: the unit tests and the fuzz targets)
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_ASAN_BUILD_DIR:-build-asan}

if [[ ! -f $build/build.ninja ]]; then
    # -O0: the compile is most of this build's cost and the instrumented unit tests take
    # seconds either way; line tables for the reports' line numbers.
    CC=clang CXX=clang++ cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=None \
        -DCMAKE_C_FLAGS="-O0 -gline-tables-only" -DCMAKE_CXX_FLAGS="-O0 -gline-tables-only" \
        -DCORVPKG_SANITIZE=ON -DCORVPKG_BUILD_FUZZ=ON -DCORVPKG_BUILD_TESTS=ON >/dev/null
fi
if [[ $# -eq 0 ]]; then
    set -- unit_tests fuzz_targets
fi
cmake --build "$build" -j2 --target "$@"
