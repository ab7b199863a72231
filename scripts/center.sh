#!/usr/bin/env bash
# Opens the Package Center over the demo's packages: in a sandbox that shares this
# machine's network (so that a browser here reaches it), publishes the example packages
# with corv-store as the demo does and runs corv-center on http://127.0.0.1:8490. Stop it
# with Ctrl-C; every change it made goes with the sandbox. Run as root, after demo.sh
# (or scripts/build.sh).
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}
for program in tools/corvpkg/corvpkg tools/store/corv-store tools/center/corv-center; do
    if [[ ! -x $build/$program ]]; then
        echo "center.sh: no $build/$program; run scripts/demo.sh or scripts/build.sh first" >&2
        exit 1
    fi
done
exec "$build/tools/sandbox/corv-sandbox" --host-net --init tools/platform/corv-platform-setup -- \
    /bin/bash scripts/center-steps.sh "$PWD/$build"
