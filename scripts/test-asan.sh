#!/usr/bin/env bash
# Builds the unit tests with AddressSanitizer and UBSan (scripts/build-asan.sh) and runs
# them; any report fails the run.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_ASAN_BUILD_DIR:-build-asan}

bash scripts/build-asan.sh unit_tests
export ASAN_OPTIONS=${ASAN_OPTIONS:-detect_leaks=1:abort_on_error=0:strict_string_checks=1}
export UBSAN_OPTIONS=${UBSAN_OPTIONS:-print_stacktrace=1:halt_on_error=1}
# One process for the whole suite: the instrumented start-up is paid once.
"$build/tests/unit_tests" --gtest_brief=1
