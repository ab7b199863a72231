#!/usr/bin/env bash
# Configures (once) and builds the project into build/ (or $CORV_BUILD_DIR).
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}

if [[ ! -f $build/build.ninja ]]; then
    cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo
fi
cmake --build "$build" -j2
