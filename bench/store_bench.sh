#!/usr/bin/env bash
# Time and peak memory of a merged, sorted "corvpkg store list" over loopback: a maker
# store of 5,000 packages and two feeds of 1,000 each (corv-store servers in the sandbox),
# from the network (--refresh) and from the cache.
#   bash bench/store_bench.sh [rounds]
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
build=${CORV_BUILD_DIR:-build}
if [[ ${1:-} != --in-sandbox ]]; then
    bash scripts/setup-deps.sh
    cmake -S . -B "$build" -G Ninja -DCORVPKG_BUILD_BENCH=ON >/dev/null
    cmake --build "$build" -j2 --target bench_store corvpkg-cli corv-store corv-sandbox
    exec "$build/tools/sandbox/corv-sandbox" --init tools/platform/corv-platform-setup -- \
        /bin/bash bench/store_bench.sh --in-sandbox "${1:-10}"
fi
rounds=$2
store=$build/tools/store/corv-store
corvpkg=$build/tools/corvpkg/corvpkg

# name KIND N: the name of entry N, in REPLY. The first feed shares its first 100 names with the maker
# store (which shadows them), the second its first 500 with the first feed (a higher
# version, which wins).
name() {
    case $1 in
    maker) REPLY=pkg$2 ;;
    feed1) if (($2 < 100)); then REPLY=pkg$2; else REPLY=feed$2; fi ;;
    feed2) if (($2 < 500)); then REPLY=feed$2; else REPLY=extra$2; fi ;;
    esac
}

# catalogue DIR KIND COUNT VERSION: COUNT entries; every tenth depends on the one before it,
# so that the sort has chains to respect.
catalogue() {
    local dir=$1 kind=$2 count=$3 version=$4 i deps pkg
    mkdir -p "$dir"
    {
        printf '{"packages":['
        for ((i = 0; i < count; i++)); do
            name "$kind" "$i"
            pkg=$REPLY
            deps=
            if ((i % 10 == 9)); then
                name "$kind" $((i - 1))
                deps=',"conf_deppkgs":{"'$REPLY'":{">=":"1.0"}}'
            fi
            ((i > 0)) && printf ','
            printf '{"package":"%s","version":"%s","dname":"Package %d","desc":"A package of the benchmark store, number %d.","maintainer":"Bench","maintainer_url":"http://localhost/","distributor":"","distributor_url":"","silent_install":false,"silent_upgrade":true,"silent_uninstall":false,"beta":false,"link":"%s-%s.cpk","size":123456,"md5":"0123456789abcdef0123456789abcdef"%s}' \
                "$pkg" "$version" "$i" "$i" "$pkg" "$version" "$deps"
        done
        printf ']}\n'
    } >"$dir/catalogue.json"
}

serve() {
    "$store" serve "$1" --listen "127.0.0.1:$2" --log /dev/null >/dev/null &
    for _ in $(seq 50); do
        (exec 3<>"/dev/tcp/127.0.0.1/$2") 2>/dev/null && return 0
        sleep 0.1
    done
    echo "corv-store did not start on $2" >&2
    exit 1
}

catalogue /tmp/bench-maker maker 5000 1.0
catalogue /tmp/bench-feed1 feed1 1000 1.0
catalogue /tmp/bench-feed2 feed2 1000 1.1
serve /tmp/bench-maker 8490
serve /tmp/bench-feed1 8491
serve /tmp/bench-feed2 8492
printf 'package_server="http://127.0.0.1:8490"\n' >>/etc.defaults/corvinfo.conf
"$corvpkg" feed add http://127.0.0.1:8491/feed >/dev/null
"$corvpkg" feed add http://127.0.0.1:8492/feed/array >/dev/null

"$corvpkg" store list --refresh --json >/tmp/bench-list.json
printf 'merged list: %s entries, %s bytes of JSON\n' \
    "$(grep -o '"package":' /tmp/bench-list.json | wc -l)" "$(wc -c </tmp/bench-list.json)"
"$build/bench/bench_store" "$rounds" "store list --refresh (network)" \
    "$corvpkg" store list --refresh --json
"$build/bench/bench_store" "$rounds" "store list (cache)" "$corvpkg" store list --json
"$build/bench/bench_store" "$rounds" "store list (cache, table)" "$corvpkg" store list
