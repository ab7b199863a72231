#!/usr/bin/env bash
# Builds the benchmarks and runs them in the sandbox (they write /var/packages).
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}
bash scripts/setup-deps.sh
cmake -S . -B "$build" -G Ninja -DCORVPKG_BUILD_BENCH=ON >/dev/null
cmake --build "$build" -j2 --target bench_registry corv-sandbox
"$build/tools/sandbox/corv-sandbox" --volume /volume1:512M \
    --init tools/platform/corv-platform-setup -- "$build/bench/bench_registry" "$@"
