#!/usr/bin/env bash
# Ctrl-C ends a soak long before its time, in good order and with a report.
#
#   check_interrupt.sh PROGRAM DIRECTORY
set -euo pipefail
program=$1 directory=$2
rm -rf "$directory" && mkdir -p "$directory"
"$program" 60 --output "$directory" --grace 90 >"$directory/output" 2>&1 &
soak=$!
for _ in $(seq 1200); do
    [[ $(wc -l 2>/dev/null <"$directory/rates.csv") -lt 2 ]] || break
    sleep 0.1
done
kill -INT "$soak"
status=0
wait "$soak" || status=$?
cat "$directory/output"
[[ $status -eq 0 && -s $directory/report.md ]] || { echo "status $status, or no report"; exit 1; }
grep -q '^interrupted$' "$directory/output"
