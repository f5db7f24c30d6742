#!/usr/bin/env bash
# Draws the README's pictures anew, from what the programs of a build really print; `./dev pictures` is the way to it.
#
#   make.sh BUILD_DIRECTORY
set -euo pipefail
cd "$(dirname "$(readlink -f "$0")")/../.."
build=$(readlink -f "$1")
new=$build/pictures
rm -rf "$new" && mkdir -p "$new"

docs/pictures/picture.py --title './dev demo' --prompt --rows 100 \
    --begin 'Three processes' --cut '  -- server..All messages' "$new/demo.svg" ./dev demo

# One queue grows, one shrinks, one is nearly full.
tests/support/sandbox.sh docs/pictures/busy.sh "$build/tools/tavo" \
    docs/pictures/picture.py --title 'tavo top' --until ' \+[1-9].* -[1-9][^\n]*\[.* 9[0-9]%' \
    "$new/top.svg" "$build/tools/tavo" top

# What would tell whose machine it was.
for picture in "$new"/*.svg; do
    for private in "$PWD" "$build" "${HOME-}" "$(hostname)" "$(id -un)"; do
        if [[ ${#private} -gt 1 ]] && grep -qwF -e "$private" "$picture"; then
            echo "$(basename "$picture") shows '$private'" >&2
            exit 1
        fi
    done
done
mv "$new"/*.svg docs/pictures/
ls -l docs/pictures/*.svg
