#!/usr/bin/env bash
# Median time to install and uninstall a package of 2,000 files and 50 MiB, next to the
# time of its two tar extractions alone, in the sandbox (the install writes /var/packages).
#   bash bench/install_bench.sh [rounds]
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}
bash scripts/setup-deps.sh
cmake -S . -B "$build" -G Ninja -DCORVPKG_BUILD_BENCH=ON >/dev/null
cmake --build "$build" -j2 --target bench_install corv-sandbox corv-initctl corvpkgctl
"$build/tools/sandbox/corv-sandbox" --volume /volume1:512M \
    --init tools/platform/corv-platform-setup -- "$build/bench/bench_install" "$@"
