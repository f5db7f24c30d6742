#!/usr/bin/env bash
# Finds calls of tavo_print_log in the source directories given; fails and shows each place when there is one.
#
#   check_log_calls.sh DIRECTORY ...
set -euo pipefail

status=0
places=$(grep -rnE --include='*.cpp' --include='*.h' '\btavo_print_log[[:space:]]*\(' "$@") || status=$?
if ((status > 1)); then exit "$status"; fi
if [[ -n $places ]]; then
    echo "$places"
    echo "Use TAVO_LOG (log/module_log.h) instead of calling tavo_print_log." >&2
    exit 1
fi
