#!/usr/bin/env bash
# The comparison runs with all its peers, hardly measuring, and a page can be made of it.
#
#   smoke.sh SANDBOX PROGRAM DIRECTORY
set -euo pipefail
"$1" "$2" --smoke >"$3/figures.json"
python3 -B "$(dirname "$0")/report.py" "$3/figures.json" "$3/benchmarks.md"
for family in Queues Calls Logging Locks; do grep -q "^## $family\$" "$3/benchmarks.md"; done
