#!/usr/bin/env bash
# Builds the project and shows the corvpkg command line at work on the example package,
# inside the sandbox, so the machine itself is left untouched. Run as root.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

bash scripts/setup-deps.sh
bash scripts/build.sh

build=${CORV_BUILD_DIR:-build}
# One sandbox for all steps, so that each step sees what the previous ones left.
exec "$build/tools/sandbox/corv-sandbox" --init tools/platform/corv-platform-setup -- \
    /bin/bash scripts/demo-steps.sh "$PWD/$build/tools/corvpkg/corvpkg" \
    "$PWD/$build/tools/store/corv-store"
