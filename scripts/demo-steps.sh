#!/usr/bin/env bash
# The demo's steps, run inside the sandbox by demo.sh. Argument: the corvpkg program.
set -uo pipefail
corvpkg=$1
cd "$(dirname "${BASH_SOURCE[0]}")/.."

step() {
    printf '\n==== %s\n$ corvpkg %s\n' "$1" "${*:2}"
    "$corvpkg" "${@:2}"
    printf '(exit status %d)\n' "$?"
}

step "Version of the command line" --version
step "This machine: OS, architecture, volumes, temporary space" system --size 1048576
step "What the example package declares" info examples/hello --lang ger
step "Build the package file" build examples/hello -o /tmp/hello.cpk
step "Look inside the file without installing it" inspect /tmp/hello.cpk
step "Ask whether it can be installed (the maker has not signed it)" check /tmp/hello.cpk
step "Installed packages" list
step "Versions compare number by number" version-compare 1.10-0002 '>' 1.9-0045
printf '\n==== Demo finished\n'
