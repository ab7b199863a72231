#!/usr/bin/env bash
# The steps of store_install_bench.sh, inside the sandbox. Arguments: the corvpkg program,
# the corv-store program, the number of rounds.
set -euo pipefail
corvpkg=$1
store=$2
rounds=${3:-3}
src=/tmp/bench-src/bigpkg
dir=/tmp/bench-store
port=8490

# A package of 2,000 files and 50 MiB of random bytes (they do not compress, as real
# binaries barely do), from the skeleton of "corvpkg new".
"$corvpkg" new bigpkg "$src" >/dev/null
for i in $(seq 0 1999); do
    mkdir -p "$src/package/d$((i % 50))"
    head -c 26214 /dev/urandom >"$src/package/d$((i % 50))/f$i"
done
mkdir -p "$dir"
"$corvpkg" build "$src" -o "$dir/bigpkg.cpk" >/dev/null
"$store" index "$dir" >/dev/null
"$store" serve "$dir" --listen "127.0.0.1:$port" --log /dev/null >/dev/null &
server=$!
trap 'kill $server 2>/dev/null' EXIT
for _ in $(seq 50); do
    (exec 3<>"/dev/tcp/127.0.0.1/$port") 2>/dev/null && break
    sleep 0.1
done
printf 'package_server="http://127.0.0.1:%s"\n' "$port" >>/etc.defaults/corvinfo.conf
cp "$dir/bigpkg.cpk" /tmp/bigpkg.cpk

# seconds COMMAND...: the wall time of the command, which must succeed.
seconds() {
    local start end
    start=$(date +%s.%N)
    "$@" >/dev/null 2>&1 || { echo "failed: $*" >&2; exit 1; }
    end=$(date +%s.%N)
    awk -v a="$start" -v b="$end" 'BEGIN { printf "%.3f\n", b - a }'
}
median() { sort -n | awk '{ v[NR] = $1 } END { print v[int((NR + 1) / 2)] }'; }

local_times=() store_times=()
for _ in $(seq "$rounds"); do
    local_times+=("$(seconds "$corvpkg" install /tmp/bigpkg.cpk --no-verify --no-start)")
    "$corvpkg" uninstall bigpkg >/dev/null
    store_times+=("$(seconds "$corvpkg" install bigpkg --no-verify --no-start)")
    "$corvpkg" uninstall bigpkg >/dev/null
done
local_median=$(printf '%s\n' "${local_times[@]}" | median)
store_median=$(printf '%s\n' "${store_times[@]}" | median)
printf 'package: 2000 files, %s bytes, %s rounds (medians)\n' "$(stat -c %s /tmp/bigpkg.cpk)" \
    "$rounds"
printf '  install of the local file       %7.3f s\n' "$local_median"
printf '  install by name from corv-store %7.3f s\n' "$store_median"
printf '  ratio                           %7.3f\n' "$(awk -v a="$local_median" -v b="$store_median" 'BEGIN { print b / a }')"
