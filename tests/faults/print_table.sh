#!/usr/bin/env bash
# Puts the rows that the tests wrote together, and adds them up.
#
#   print_table.sh DIRECTORY_OF_ROWS LIST_OF_EXPORTED_NAMES
set -euo pipefail
shopt -s nullglob
rows=("$1"/*.row)
printf '%-62s%7s%7s%7s%7s%7s%7s%7s%7s%8s%7s%7s\n' function memory descr. thread clock file socket driver process "as if" told ended
[[ ${#rows[@]} -eq 0 ]] || cat "${rows[@]}"
cat "${rows[@]}" /dev/null | awk -v rows="${#rows[@]}" -v names="$(grep -c . "$2")" '
    /^    \*/ { kept += $2; next }
    /^    -/ { skipped++; next }
    $NF ~ /^[0-9]+$/ && $(NF - 1) ~ /^[0-9]+$/ && $(NF - 2) ~ /^[0-9]+$/ { functions++; same += $(NF - 2); told += $(NF - 1); ended += $NF }
    END { printf "\n%d rows of %d exported names, %d functions: %d faults, %d as if nothing had happened, %d told, %d ended, %d of these with something kept; calls left out for %d named reasons\n",
                 rows, names, functions, same + told + ended, same, told, ended, kept, skipped }'
