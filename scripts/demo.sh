#!/usr/bin/env bash
# Builds the project and shows the corvpkg command line at work on the example package,
# inside the sandbox, so the machine itself is left untouched. Run as root.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

bash scripts/setup-deps.sh
bash scripts/build.sh

build=${CORV_BUILD_DIR:-build}
sandbox=$build/tools/sandbox/corv-sandbox
corvpkg=$build/tools/corvpkg/corvpkg

step() {
    printf '\n==== %s\n' "$1"
    shift
    printf '$ %s\n' "$*"
    "$sandbox" --init tools/platform/corv-platform-setup -- "$@"
}

step "Version of the command line" "$corvpkg" --version
step "What the example package declares" "$corvpkg" info examples/hello
step "The same, as JSON" "$corvpkg" info examples/hello --json
printf '\n==== Demo finished\n'
