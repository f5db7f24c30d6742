#!/usr/bin/env bash
# A family's example prints what examples/families/FAMILY.out says, and the family's page shows it.
#
#   check_output.sh SOURCE_DIR FAMILY COMMAND ...
set -euo pipefail

source=$1 family=$2
shift 2
output=$("$@" && echo .)
diff "$source/examples/families/$family.out" <(printf %s "${output%.}")
grep -qF "\\include families/$family.c" "$source/docs/families/$family.md" ||
    { echo "docs/families/$family.md does not show the example"; exit 1; }
