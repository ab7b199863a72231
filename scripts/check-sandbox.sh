#!/usr/bin/env bash
# Checks corv-sandbox from the host's side: what a sandbox writes never reaches the host nor
# the next sandbox (unless asked with --keep or --bind), exit statuses come through, and
# nothing the command starts outlives the sandbox.
#
# usage: scripts/check-sandbox.sh [PATH-TO-corv-sandbox]   (as root)
set -euo pipefail

root=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
sandbox=${1:-${CORV_SANDBOX_BIN:-$root/build/tools/sandbox/corv-sandbox}}
if [[ ! -x $sandbox ]]; then
    echo "check-sandbox: $sandbox not found; build it first (scripts/build.sh)" >&2
    exit 2
fi

failures=0
passes=0
check() {
    local what=$1
    shift
    if "$@"; then
        echo "ok   - $what"
        passes=$((passes + 1))
    else
        echo "FAIL - $what"
        failures=$((failures + 1))
    fi
}

scratch=$(mktemp -d /tmp/check-sandbox.XXXXXX)
trap 'rm -rf "$scratch"' EXIT
token="probe-$$-$RANDOM"
probe=/etc/corv-sandbox-probe-$token

# 1. Changes stay inside one run.
first=$("$sandbox" -- sh -c "echo $token > $probe && echo $token > /volume1/probe && cat $probe")
check "the first run can write to / and /volume1" test "$first" = "$token"
check "the host does not see the file" test ! -e "$probe"
second=$("$sandbox" -- sh -c "cat $probe /volume1/probe 2>/dev/null || echo absent")
check "the second run does not see the files" test "$second" = absent

# 2. Volumes: one of 64 MiB by default, as asked otherwise.
sizes=$("$sandbox" -- df -B1 --output=size /volume1 | tail -n 1)
check "/volume1 is 64 MiB by default" test "$sizes" -eq 67108864
sizes=$("$sandbox" --volume /volume1:32M --volume /volume2:1G -- \
    df -B1 --output=size /volume1 /volume2 | tail -n 2 | tr -d ' ' | tr '\n' ' ')
check "--volume sets sizes and replaces the default" test "$sizes" = "33554432 1073741824 "
volumes=$("$sandbox" --no-volume -- sh -c 'ls -d /volume* 2>/dev/null || echo none')
check "--no-volume gives none" test "$volumes" = none

# 3. Exit statuses.
status=0
"$sandbox" -- sh -c 'exit 7' || status=$?
check "the command's exit status comes through" test "$status" -eq 7
status=0
"$sandbox" -- sh -c 'kill -TERM $$' || status=$?
check "a command killed by SIGTERM gives 143" test "$status" -eq 143
status=0
"$sandbox" --init /bin/false -- true 2>/dev/null || status=$?
check "a failing --init gives 125" test "$status" -eq 125

# 4. Signals and leftovers: the sandbox answers SIGTERM, and a daemon the command left
# behind dies with it.
# A duration no other process on the host is likely to sleep for, to find the daemon by.
duration="$((1000 + RANDOM)).$$"
running() { pgrep -f "^sleep $duration\$" >/dev/null; }
"$sandbox" -- sh -c "setsid sleep $duration & exec sleep 300" &
pid=$!
for _ in $(seq 50); do
    running && break
    sleep 0.1
done
check "the daemon runs while the sandbox runs" running
kill -TERM "$pid"
status=0
wait "$pid" || status=$?
check "SIGTERM to the sandbox ends the command (143)" test "$status" -eq 143
sleep 0.2
check "nothing is left behind" eval '! running'

# 5. --keep keeps changes for the next run with the same directory, still not on the host.
keep=$scratch/keep
"$sandbox" --keep "$keep" -- sh -c "echo $token > $probe && echo $token > /volume1/probe"
kept=$("$sandbox" --keep "$keep" -- sh -c "cat $probe /volume1/probe")
check "--keep carries / and /volume1 over" test "$kept" = "$token"$'\n'"$token"
check "--keep still leaves the host alone" test ! -e "$probe"

# 6. --bind passes a host directory through, read-write.
mkdir "$scratch/shared"
"$sandbox" --bind "$scratch/shared" -- sh -c "echo $token > $scratch/shared/out"
check "--bind writes reach the host" test "$(cat "$scratch/shared/out" 2>/dev/null)" = "$token"

echo "$passes passed, $failures failed"
[[ $failures -eq 0 ]]
