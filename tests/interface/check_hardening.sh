#!/usr/bin/env bash
# Checks how a shared library was linked and compiled. Fails and names whatever is missing.
#
#   check_hardening.sh READELF OBJDUMP LIBRARY [fortified] [branches]
#
# fortified: the C library's checked calls are in use, as in every optimised build; branches: code that is jumped to says
# so, where the processor has a use for it.
set -euo pipefail

readelf=$1 objdump=$2 library=$3
shift 3

segments=$("$readelf" -lW "$library")
dynamic=$("$readelf" -dW "$library")
imports=$("$readelf" --dyn-syms -W "$library" | awk '$7 == "UND" { print $8 }')
status=0
missing() {
    echo "$library: $1"
    status=1
}

grep -qE '^ *GNU_RELRO' <<<"$segments" || missing "the tables of addresses stay writable (no RELRO)"
grep -qE '\((FLAGS|FLAGS_1|BIND_NOW)\).*\b(BIND_NOW|NOW)\b' <<<"$dynamic" || missing "calls are bound lazily (no BIND_NOW)"
! grep -q TEXTREL <<<"$dynamic" || missing "the loader changes code (TEXTREL)"
grep -qE '^ *GNU_STACK .* RW +0x' <<<"$segments" || missing "the stack is executable"
! grep -qE '^ *LOAD .* RWE +0x' <<<"$segments" || missing "a segment is writable and executable"
! grep -qE '^ *LOAD +0x0+ .* R E +0x' <<<"$segments" || missing "code lies on pages with data (no separate code)"
grep -q '^__stack_chk_fail' <<<"$imports" || missing "no stack protector"
for wanted in "$@"; do
    case $wanted in
        fortified)
            [[ $(grep -E '^__.*_chk(@|$)' <<<"$imports" | grep -vc stack) -gt 0 ]] || missing "no checked calls (_FORTIFY_SOURCE)"
            ;;
        branches)
            # The linker's mark needs start files that have it, which not every distribution's do: so the code is asked.
            [[ $("$objdump" -d --no-show-raw-insn "$library" | grep -c endbr) -gt 0 ]] || missing "no branch protection"
            ;;
    esac
done
exit "$status"
