#!/usr/bin/env bash
# An installed prefix is usable by a developer: the library, headers, pkg-config file and
# CMake package are found wherever the prefix was put, a small program builds and runs
# against them both ways, and the reference platform's stand-in tools stay out of it.
set -euo pipefail
build=$1
prefix=$(mktemp -d)
trap 'rm -rf "$prefix"' EXIT
cmake --install "$build" --prefix "$prefix/first" >/dev/null
# Moving the prefix after the install must not break it: the files hold no absolute paths.
mv "$prefix/first" "$prefix/moved"
root=$prefix/moved

fail() { echo "FAIL: $*" >&2; exit 1; }
for tool in sbin/initctl bin/init-check.sh sbin/corvpkgctl bin/corv-codesign sbin/corv-platform-setup \
    lib/security lib64/security lib/x86_64-linux-gnu/security bin/corvcrt bin/corv-selfcheck; do
    [[ ! -e $root/$tool ]] || fail "the stand-in $tool was installed without being asked for"
done
[[ -x $root/bin/corvpkg ]] || fail "corvpkg not installed"
ls "$root"/share/man/man1/corvpkg-install.1 >/dev/null || fail "no manual page for corvpkg install"
grep -q '^corvpkg-install \\- ' "$root/share/man/man1/corvpkg-install.1" || fail "the page of install is not named corvpkg-install"
[[ -f $root/share/bash-completion/completions/corvpkg ]] || fail "no bash completion"

cat >"$prefix/probe.cc" <<'CC'
#include <stdio.h>
#include "corvpkg/corvpkg.h"
int main() {
    CORVPackageTool::PackageBasicInfo a("probe", "1.2-0003"), b("probe", "1.10-0001");
    printf("%s %d\n", CORVPackageTool::CORVPKGLibraryVersion(),
           a.compare(b, CORVPackageTool::PKG_COMPOP_LT) ? 1 : 0);
    return 0;
}
CC
pcdir=$(dirname "$(find "$root" -name corvpkg.pc)")
flags=$(PKG_CONFIG_PATH=$pcdir pkg-config --cflags --libs corvpkg)
[[ $flags == *"-I$root/"* ]] || fail "pkg-config points elsewhere: $flags"
libdir=$(PKG_CONFIG_PATH=$pcdir pkg-config --variable=libdir corvpkg)
# shellcheck disable=SC2086
g++ -std=c++17 "$prefix/probe.cc" -o "$prefix/probe-pc" $flags
out=$(LD_LIBRARY_PATH=$libdir "$prefix/probe-pc")
[[ $out == "1.0.0 1" ]] || fail "program built with pkg-config printed '$out'"

mkdir "$prefix/cm"
cat >"$prefix/cm/CMakeLists.txt" <<'CM'
cmake_minimum_required(VERSION 3.18)
project(probe CXX)
find_package(corvpkg 1 REQUIRED)
add_executable(probe ../probe.cc)
target_link_libraries(probe PRIVATE corvpkg::corvpkg)
CM
cmake -S "$prefix/cm" -B "$prefix/cm/build" -DCMAKE_PREFIX_PATH="$root" >/dev/null
cmake --build "$prefix/cm/build" >/dev/null
out=$(LD_LIBRARY_PATH=$libdir "$prefix/cm/build/probe")
[[ $out == "1.0.0 1" ]] || fail "program built with find_package printed '$out'"
echo "install prefix: pkg-config and find_package both build against $root"
