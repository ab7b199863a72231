#!/usr/bin/env bash
# Installs what is missing, builds, and runs the whole test suite. Run as root: the
# integration tests run in corv-sandbox, which needs namespaces and mounts. The last line
# printed is ctest's summary.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}

bash scripts/setup-deps.sh
bash scripts/build.sh
bash scripts/check-sandbox.sh "$build/tools/sandbox/corv-sandbox"

log=$(mktemp)
trap 'rm -f "$log"' EXIT
status=0
# Two jobs for two cores; a sandboxed test case starts in a few tens of milliseconds.
# A test that declares no timeout of its own gets two minutes, so that a hung one cannot
# hold the whole run.
ctest --test-dir "$build" --output-on-failure -j2 --timeout 120 2>&1 | tee "$log" || status=$?

# The unit tests again under AddressSanitizer and UBSan, and each fuzz target for a few
# seconds from its seeds: a crash, a leak or undefined behaviour fails the run.
extra=()
bash scripts/test-asan.sh || { status=1; extra+=("sanitizer unit tests FAILED"); }
bash scripts/fuzz.sh "${CORV_FUZZ_SECONDS:-5}" || { status=1; extra+=("fuzz targets FAILED"); }

# ctest closes with its timing and the list of failures; repeat its summary last.
summary=$(grep -E '^[0-9]+% tests passed' "$log" | tail -n 1 || true)
if [[ -z $summary ]]; then
    echo "test.sh: ctest ran no test" >&2
    exit 1
fi
echo
for line in "${extra[@]}"; do
    echo "test.sh: $line"
done
echo "$summary"
exit "$status"
