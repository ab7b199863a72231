#!/usr/bin/env bash
# Median time to install a package of 2,000 files and 50 MiB by name from a corv-store on
# loopback (download, checksum, install), next to the install of the same file from the
# local disk, and their ratio; in the sandbox.
#   bash bench/store_install_bench.sh [rounds]
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}
bash scripts/setup-deps.sh
cmake -S . -B "$build" -G Ninja >/dev/null
cmake --build "$build" -j2 --target corvpkg-cli corv-store corv-sandbox corv-initctl corvpkgctl
"$build/tools/sandbox/corv-sandbox" --volume /volume1:512M \
    --init tools/platform/corv-platform-setup -- /bin/bash bench/store_install_steps.sh \
    "$PWD/$build/tools/corvpkg/corvpkg" "$PWD/$build/tools/store/corv-store" "$@"
