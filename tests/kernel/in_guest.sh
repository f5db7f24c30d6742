#!/usr/bin/env bash
# Runs one program in the guest that boot.sh started, in a sandbox there: its output and its exit status are this
# script's. tests/support/sandbox.sh does it where $TAVO_TEST_GUEST names the folder of a running guest.
#
#   in_guest.sh PROGRAM [ARGUMENT ...]
set -euo pipefail
guest=$TAVO_TEST_GUEST

expect_guest() {
    flock --shared --nonblock "$guest/running" true || return 0
    printf '\nin_guest.sh: the guest has ended: see %s\n' "$guest/console" >&2
    exit 1
}

# A slot belongs to whoever holds its lock, so to nobody when its holder was killed.
take_slot() {
    local lock
    for ((;;)); do
        for slot in "$guest"/slot?; do
            exec {lock}<"$slot"
            flock -n "$lock" && return
            exec {lock}<&-
        done
        sleep 0.05
    done
}

# One line from the guest, in $line. Where the pipe stays silent the guest may be gone.
read_line() {
    local part
    line=
    until IFS= read -r -t 2 -u "$output" part; do
        line+=$part
        expect_guest
    done
    line+=$part
}

# Where the build is for another machine, the guest is that machine: it needs no emulator.
if [[ $1 == env && $2 == TAVO_EMULATOR=* ]]; then
    read -ra emulator <<<"${2#TAVO_EMULATOR=}"
    shift $((2 + ${#emulator[@]}))
fi

expect_guest
take_slot
number=$$.${EPOCHREALTIME//[.,]/}
exec {output}<>"$slot.out" {input}<>"$slot.in"
printf '%q ' "$number" "$PWD" "$@" >&"$input"
echo >&"$input"

# What comes before is left over from a test that was given up.
until [[ ${line-} == "=== begin $number" ]]; do read_line; done
separator=
for ((;;)); do
    read_line
    [[ $line != "=== end $number "* ]] || exit "${line##* }"
    printf '%s%s' "$separator" "$line"
    separator=$'\n'
done
