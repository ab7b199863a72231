#!/usr/bin/env bash
# Runs a Package Center test inside the sandbox (one sandbox per test): builds the example
# packages, publishes them with a real corv-store as a feed next to an empty maker store,
# makes an administrator and a plain user, starts corv-center and runs the Python test.
# usage: run.sh api|browser CORVPKG CORV_STORE CORV_CENTER ARTEFACT_DIR
set -euo pipefail
which=$1 corvpkg=$2 store=$3 center=$4 artefacts=$5
here=$(cd "$(dirname "$0")" && pwd)
source_dir=$(cd "$here/../.." && pwd)
out=/tmp/examples
mkdir -p "$out/published" /tmp/maker-store "$artefacts"

# hello 1.0, greeter 1.0 and the greeter 1.1 that the browser test publishes later.
"$corvpkg" build "$source_dir/examples/hello" -o "$out/published/hello-1.0.0-0001.cpk" >/dev/null
"$corvpkg" build "$source_dir/examples/greeter" -o "$out/published/greeter-1.0.0-0001.cpk" >/dev/null
cp -a "$source_dir/examples/greeter" /tmp/greeter-1.1
sed -i 's/^version=.*/version="1.1.0-0001"/' /tmp/greeter-1.1/INFO
"$corvpkg" build /tmp/greeter-1.1 -o "$out/greeter-1.1.0-0001.cpk" >/dev/null

"$store" index "$out/published" >/dev/null
"$store" index /tmp/maker-store >/dev/null
printf 'package_server="http://127.0.0.1:8480"\n' >>/etc.defaults/corvinfo.conf
pids=()
trap 'for pid in "${pids[@]}"; do kill "$pid" 2>/dev/null || true; done' EXIT
"$store" serve /tmp/maker-store --listen 127.0.0.1:8480 --log /tmp/maker.log >/dev/null &
pids+=($!)
"$store" serve "$out/published" --listen 127.0.0.1:8481 --log /tmp/feed.log >/dev/null &
pids+=($!)

# alice and carol administer the machine; bob is a plain user.
groupadd -f administrators
useradd -M -G administrators alice
useradd -M -G administrators carol
useradd -M bob
printf 'alice:alice-secret\ncarol:carol-secret\nbob:bob-secret\n' | chpasswd
cp "$source_dir/tools/center/pam/corv-center" /etc/pam.d/corv-center

"$center" --listen 127.0.0.1:8490 --state /tmp/center-state --max-upload 1 \
    >/tmp/center.out 2>"$artefacts/center-$which.log" &
pids+=($!)
for port in 8480 8481 8490; do
    for _ in $(seq 50); do
        (exec 3<>"/dev/tcp/127.0.0.1/$port") 2>/dev/null && break
        sleep 0.1
    done
done
"$corvpkg" feed add http://127.0.0.1:8481/feed >/dev/null

export CENTER_URL=http://127.0.0.1:8490 CENTER_ARTEFACTS=$artefacts CORV_STORE=$store
export CENTER_FEED_DIR=$out/published CENTER_UPGRADE=$out/greeter-1.1.0-0001.cpk
export CENTER_HELLO=$out/published/hello-1.0.0-0001.cpk
/usr/bin/python3 "$here/${which}_test.py"
