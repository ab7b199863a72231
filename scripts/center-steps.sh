#!/usr/bin/env bash
# The Package Center's set-up inside the sandbox of center.sh. Argument: the build directory.
set -euo pipefail
build=$1
cd "$(dirname "${BASH_SOURCE[0]}")/.."
corvpkg=$build/tools/corvpkg/corvpkg
store=$build/tools/store/corv-store
out=/tmp/examples

sh examples/build.sh "$corvpkg" $out >/dev/null
mkdir -p $out/published /tmp/maker-store
cp $out/hello-1.0.0-0001.cpk $out/greeter-1.0.0-0001.cpk $out/published/
"$store" index $out/published >/dev/null
"$store" index /tmp/maker-store >/dev/null
printf 'package_server="http://127.0.0.1:8480"\n' >>/etc.defaults/corvinfo.conf
"$store" serve /tmp/maker-store --listen 127.0.0.1:8480 --log /tmp/maker-store.log >/dev/null &
"$store" serve $out/published --listen 127.0.0.1:8481 --log /tmp/feed.log >/dev/null &
sleep 0.5
"$corvpkg" feed add http://127.0.0.1:8481/feed >/dev/null

# The one administrator of this sandbox, with a password made up now.
password=$(head -c 12 /dev/urandom | base64 | tr -d '/+=')
groupadd -f administrators
useradd -M -G administrators admin 2>/dev/null || usermod -aG administrators admin
printf 'admin:%s\n' "$password" | chpasswd
cp tools/center/pam/corv-center /etc/pam.d/corv-center

"$build/tools/center/corv-center" --listen 127.0.0.1:8490 &
center=$!
sleep 0.5
cat <<TEXT

The Package Center runs on http://127.0.0.1:8490 (this machine only).
Log in as admin with the password $password
The store offers hello and greeter 1.0. Press Enter here to publish greeter 1.1, so
that the page offers it as an update; Ctrl-C ends everything.
TEXT
read -r _ || true
cp $out/greeter-1.1.0-0001.cpk $out/published/
"$store" index $out/published >/dev/null
echo "greeter 1.1.0-0001 is published; Ctrl-C ends everything."
wait $center
