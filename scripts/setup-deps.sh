#!/usr/bin/env bash
# Installs the Debian 12 packages needed to build and test the project, only those missing.
# Run as root.
set -euo pipefail

packages=(
    cmake ninja-build g++ pkg-config
    libjsoncpp-dev libcurl4-openssl-dev libssl-dev libboost-dev
    libgtest-dev libbenchmark-dev
    clang-format util-linux passwd ca-certificates
    procps # pgrep, for scripts/check-sandbox.sh
    postgresql nginx-light cron # the daemons of the reference platform's system services
    libgpgme-dev gnupg # corv-codesign, the reference platform's package signature tool
    help2man # the manual pages, written from corvpkg's help texts
    libcpp-httplib-dev # corv-store, the package store server of the tests and the demo
    libkainjow-mustache-dev # the web server's rendering of package portal templates
    syslog-ng-core logrotate # the logging daemons that packages' log fragments configure
    libpam0g-dev pamtester # the platform's PAM modules, and signing in through packages' PAM files
    acl libacl1-dev # shares of the reference platform: POSIX ACLs, getfacl in the tests
    libsqlite3-dev sqlite3 # the reference platform's search and media index
    pigz # the gzip that the reference platform gives tar for package payloads
    clang libclang-rt-14-dev # libFuzzer and the sanitizers (scripts/fuzz.sh, scripts/test-asan.sh)
    chromium chromium-driver python3-selenium # the Package Center's tests in a headless browser
)

missing=()
for package in "${packages[@]}"; do
    status=$(dpkg-query -W -f='${db:Status-Status}' "$package" 2>/dev/null || true)
    [[ $status == installed ]] || missing+=("$package")
done

if [[ ${#missing[@]} -eq 0 ]]; then
    echo "setup-deps: all ${#packages[@]} packages present"
    exit 0
fi
if [[ $(id -u) -ne 0 ]]; then
    echo "setup-deps: missing ${missing[*]}; run as root to install them" >&2
    exit 1
fi
echo "setup-deps: installing ${missing[*]}"
export DEBIAN_FRONTEND=noninteractive
apt-get update -q
apt-get install -y -q --no-install-recommends "${missing[@]}"
