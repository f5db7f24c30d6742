#!/usr/bin/env bash
# Two processes share a queue, a block and a semaphore under tavo-private-storage; nothing of it is left anywhere.
#
#   check_private_storage.sh COMMAND PROGRAM STORAGE_ROOT
set -euo pipefail

command=$1 program=$2 root=$3
place=$(mktemp -d)
trap 'rm -rf "$place"' EXIT
export TMPDIR=$place

before=$(ls -A "$root" 2>/dev/null || echo none)
output=$("$command" "$program" serve 2>"$place/log" | tail -n 1)
[[ $output == "the other process said hello" ]] || { echo "unexpected: $output"; cat "$place/log"; exit 1; }
[[ $(ls -A "$root" 2>/dev/null || echo none) == "$before" ]] || { echo "$root was touched"; exit 1; }
rm "$place/log"
[[ -z $(ls -A "$place") ]] || { echo "left behind: $(ls -A "$place")"; exit 1; }

status=0
"$command" sh -c 'exit 7' || status=$?
[[ $status -eq 7 ]] || { echo "the exit status was $status"; exit 1; }
status=0
"$command" 2>/dev/null || status=$?
[[ $status -eq 2 ]] || { echo "without a program, the exit status was $status"; exit 1; }
"$command" --help | grep -q "usage: tavo-private-storage" || { echo "no help"; exit 1; }
