#!/usr/bin/env bash
# The bash completion offers corvpkg's commands, a command's own options, and installed
# package names where a command takes one, all read from the program's help.
set -euo pipefail
corvpkg=$1
source "$2"
fail() { echo "FAIL: $*" >&2; exit 1; }
complete_words() {  # the words typed so far, the last one being completed
    COMP_WORDS=("$corvpkg" "$@")
    COMP_CWORD=$#
    COMPREPLY=()
    _corvpkg
    printf '%s\n' "${COMPREPLY[@]}"
}
[[ $(complete_words in) == *install* && $(complete_words in) == *inspect* ]] || fail "commands: $(complete_words in)"
[[ $(complete_words un) == uninstall ]] || fail "un completes to: $(complete_words un)"
[[ $(complete_words uninstall --f) == --force ]] || fail "uninstall --f completes to: $(complete_words uninstall --f)"
[[ $(complete_words install --no-) == *--no-start* ]] || fail "install --no-: $(complete_words install --no-)"
# Outside a machine with packages there is nothing to offer for a name, and no error.
[[ -z $(complete_words status zz-none) ]] || fail "status offered names that do not exist"
echo "completion: commands and options complete"
