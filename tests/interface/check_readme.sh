#!/usr/bin/env bash
# The README's example is examples/hello.c to the letter.
#
#   check_readme.sh SOURCE_DIRECTORY
set -euo pipefail
diff <(sed -n '/^```c$/,/^```$/p' "$1/README.md" | sed '1d;$d') "$1/examples/hello.c"
