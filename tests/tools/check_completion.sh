#!/usr/bin/env bash
# Checks what the completion proposes for a few command lines.
#
#   check_completion.sh TAVO COMPLETION
set -euo pipefail

# shellcheck source=/dev/null
source "$2"
tavo=$1
status=0

check() { # EXPECTED WORD ...: the last word is the one to be completed
    local expected=$1
    shift
    COMP_WORDS=("$tavo" "$@") COMP_CWORD=$#
    COMPREPLY=()
    _tavo
    if [[ ${COMPREPLY[*]} != "$expected" ]]; then
        echo "for '$*': '${COMPREPLY[*]}' instead of '$expected'" >&2
        status=1
    fi
}

check 'serve send shm sem status' s
check 'doctor' do
check 'read' shm r
check 'init' sem i
check '--json' list --j
check '--file --help --lines --timeout' send 7 --
check '--offset' shm write 9 text --off
check '' send 7 s
check 'top' --verbose to
exit "$status"
