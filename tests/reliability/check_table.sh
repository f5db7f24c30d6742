#!/usr/bin/env bash
# Compares docs/reliability.md with the tests: every test it names exists, and every test in tests/reliability has a row.
#
#   check_table.sh PROJECT_DIRECTORY TABLE
set -euo pipefail
cd "$1"
table=$2

# Suite.Name of all tests in the sources given, however their macros are broken into lines.
tests_in() {
    cat "$@" | tr '\n' ' ' | grep -oE 'TEST(_F|_P)?\( *[A-Za-z0-9_]+, *[A-Za-z0-9_]+\)' |
        sed -E 's/.*\( *([A-Za-z0-9_]+), *([A-Za-z0-9_]+)\)/\1.\2/' | sort -u
}

named=$(grep -oE '`[A-Z][A-Za-z0-9]+\.[A-Z][A-Za-z0-9]+` \|$' "$table" | tr -d '`| ' | sort -u)
[[ -n $named ]] || { echo "$table names no tests"; exit 1; }
rows=$(grep -E '^\| ' "$table" | grep -vcE 'test \|$' || true)
named_rows=$(grep -cE '`[A-Z][A-Za-z0-9]+\.[A-Z][A-Za-z0-9]+` \|$' "$table")
mapfile -t every < <(find tests -name '*_test.cpp' | sort)

status=0
[[ $rows -eq $named_rows ]] || { echo "$((rows - named_rows)) rows name no test"; status=1; }
while read -r missing; do
    [[ -z $missing ]] || { echo "no such test: $missing"; status=1; }
done < <(comm -23 <(echo "$named") <(tests_in "${every[@]}"))
while read -r unlisted; do
    [[ -z $unlisted ]] || { echo "has no row: $unlisted"; status=1; }
done < <(comm -13 <(echo "$named") <(tests_in tests/reliability/*_crash_test.cpp))
exit $status
