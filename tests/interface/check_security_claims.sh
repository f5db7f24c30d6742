#!/usr/bin/env bash
# Every test that a document names exists: `Suite.Name` in the test sources, `fuzz.NAME` as a fuzz target with a corpus,
# `interface.NAME` as a check of this folder. Fails and names those that do not.
#
#   check_security_claims.sh SOURCE_DIRECTORY DOCUMENT
set -euo pipefail

root=$1 document=$2
names=$(grep -oE '`[A-Za-z0-9_]+(\.[A-Za-z0-9_]+)+`' "$document" | tr -d '`' | grep -E '^([A-Z]|fuzz\.|interface\.)' | sort -u)
tests=$(grep -rhoE --include='*_test.cpp' '^TEST(_F|_P)?\([A-Za-z0-9_]+, [A-Za-z0-9_]+\)' "$root/tests" |
    sed -E 's/^TEST(_F|_P)?\(//; s/, /./; s/\)$//')
status=0
for name in $names; do
    case $name in
        fuzz.*) [[ -n $(ls "$root/fuzz/corpus/${name#fuzz.}" 2>/dev/null) ]] ;;
        interface.hardening.*) grep -q '^add_library('"${name##*.}" "$root/CMakeLists.txt" "$root/platform/linux/binder/CMakeLists.txt" ;;
        interface.*) grep -q "NAME ${name}\\b" "$root/tests/interface/CMakeLists.txt" ;;
        *) grep -qxF "$name" <<<"$tests" ;;
    esac || {
        echo "$document names a test that does not exist: $name"
        status=1
    }
done
[[ -n $names ]] || {
    echo "$document names no test"
    status=1
}
exit "$status"
