#!/usr/bin/env bash
# A short soak, with a fault in one client if one is named: that one has to be noticed, by this line, and to fail the run.
#
#   check.sh PROGRAM DIRECTORY MINUTES [FAULT LINE [OPTION ...]]
set -euo pipefail
program=$1 directory=$2 minutes=$3 fault=${4-} line=${5-}
shift $(($# < 5 ? $# : 5))

rm -rf "$directory" && mkdir -p "$directory"
status=0
# However loaded the machine is, nobody is to be late.
"$program" "$minutes" --seed 20 --output "$directory" --grace 90 ${fault:+--break "$fault"} "$@" >"$directory/output" 2>&1 ||
    status=$?
cat "$directory/output"
cat "$directory"/*.log
for file in report.md samples.csv rates.csv; do
    [[ -s $directory/$file ]] || { echo "there is no $file"; exit 1; }
done
if [[ -z $fault ]]; then
    [[ $status -eq 0 ]] || { echo "the soak ended with $status"; exit 1; }
    grep -q '^0 failures, flat$' "$directory/output"
else
    [[ $status -eq 1 ]] || { echo "the soak ended with $status, not with 1 for $fault"; exit 1; }
    grep -qE "^FAILURE: seed 20: $line" "$directory/output" || { echo "no line says: $line"; exit 1; }
fi
