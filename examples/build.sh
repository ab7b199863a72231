#!/bin/sh
# Builds the example packages with the corvpkg command line, named <package>-<version>:
#   OUTDIR/hello-1.0.0-0001.cpk
#   OUTDIR/greeter-1.0.0-0001.cpk
#   OUTDIR/greeter-1.1.0-0001.cpk   the same source with the version raised, to upgrade to
#   OUTDIR/notes-1.0.0-0001.cpk
#   OUTDIR/notes-1.1.0-0001.cpk     likewise
# usage: examples/build.sh CORVPKG OUTDIR
set -eu

if [ $# -ne 2 ]; then
    echo "usage: $0 CORVPKG OUTDIR" >&2
    exit 2
fi
corvpkg=$1
out=$2
here=$(cd "$(dirname "$0")" && pwd)
upgrade_version=1.1.0-0001

version_of() {
    sed -n 's/^version="\(.*\)"$/\1/p' "$1/INFO"
}

mkdir -p "$out"
for name in hello greeter notes; do
    "$corvpkg" build "$here/$name" -o "$out/$name-$(version_of "$here/$name").cpk"
done

# The upgrade differs from the source only in its version, which its daemon shows in
# every answer and its scripts write into their record, and in silent_upgrade, which lets
# the scheduled update check install it without asking.
stage=$(mktemp -d)
trap 'rm -rf "$stage"' EXIT
for name in greeter notes; do
    cp -a "$here/$name" "$stage/$name"
    sed "s/^version=.*/version=\"$upgrade_version\"/" "$here/$name/INFO" >"$stage/$name/INFO"
    echo 'silent_upgrade="yes"' >>"$stage/$name/INFO"
    "$corvpkg" build "$stage/$name" -o "$out/$name-$upgrade_version.cpk"
done
