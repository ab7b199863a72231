#!/usr/bin/env bash
# Builds the fuzz targets (scripts/build-asan.sh) and runs each for SECONDS (default 60)
# from the seeds of tests/fuzz/seeds plus what earlier runs found (kept in the build
# directory). A crash, a leak, undefined behaviour or an input that runs over 10 s fails
# the run and leaves the input in <build>/fuzz-artifacts/.
#   bash scripts/fuzz.sh [SECONDS]
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
seconds=${1:-60}
build=${CORV_ASAN_BUILD_DIR:-build-asan}
sandbox=${CORV_BUILD_DIR:-build}/tools/sandbox/corv-sandbox
src=$PWD/tests/fuzz

bash scripts/build-asan.sh fuzz_targets
work=$PWD/$build/fuzz-corpus
artifacts=$PWD/$build/fuzz-artifacts
mkdir -p "$work" "$artifacts"

# The package file seed is a small package built here from the INFO seed.
seed_cpk() {
    local dir=$1 stage
    stage=$(mktemp -d)
    mkdir -p "$stage/conf" "$stage/scripts" "$stage/payload"
    cp "$src/seeds/info_reader/full" "$stage/INFO"
    printf '[b]\npkg_min_ver=1.0\n' >"$stage/conf/PKG_DEPS"
    printf '#!/bin/sh\nexit 0\n' >"$stage/scripts/preinst"
    printf '#!/bin/sh\nexit 0\n' >"$stage/scripts/start-stop-status"
    chmod 0644 "$stage/scripts/preinst"
    echo hello >"$stage/payload/file"
    tar czf "$stage/package.tgz" -C "$stage/payload" .
    tar cf "$dir/seed.cpk" -C "$stage" INFO package.tgz conf scripts
    tar cf "$dir/no_info.cpk" -C "$stage" package.tgz
    rm -rf "$stage"
}

status=0
for target in info_reader dep_string dep_json package_file; do
    corpus=$work/$target
    mkdir -p "$corpus"
    seeds=$src/seeds/$target
    run=("$PWD/$build/tests/fuzz/fuzz_$target")
    if [[ $target == package_file ]]; then
        seeds=$work/package_file_seeds
        mkdir -p "$seeds"
        seed_cpk "$seeds"
        # Hostile archives are unpacked here by /bin/tar: only in a throw-away machine.
        if [[ ! -x $sandbox ]]; then
            echo "fuzz.sh: $target skipped: no $sandbox (build the project first)" >&2
            continue
        fi
        run=("$sandbox" --bind "$PWD/$build" -- "${run[@]}")
    fi
    dict=()
    [[ -f $src/$target.dict ]] && dict=("-dict=$src/$target.dict")
    echo "fuzz.sh: $target for ${seconds}s"
    if ! "${run[@]}" "${dict[@]}" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=1024 \
        -print_final_stats=1 -artifact_prefix="$artifacts/$target-" "$corpus" "$seeds" \
        >"$work/$target.log" 2>&1; then
        echo "fuzz.sh: $target FAILED, see $work/$target.log and $artifacts" >&2
        tail -n 40 "$work/$target.log" >&2
        status=1
    else
        grep -E '^stat::number_of_executed_units' "$work/$target.log" | sed "s/^/  /" || true
    fi
done
exit "$status"
