#!/usr/bin/env bash
# Checks the manual: every page is well-formed and has the usual sections, every subcommand has a page, and every page
# mentions exactly the options that its subcommand has.
#
#   check_manual.sh TAVO MANDOC DIRECTORY
set -euo pipefail

tavo=$1 mandoc=$2 manual=$3
status=0
complain() {
    echo "$1" >&2
    status=1
}

# The long options that a help text describes, but for --help, and those of all subcommands.
options_of() { "$tavo" "$@" --help | grep -oE -- '--[a-z]+' | sort -u | grep -vxE -- '--(help|verbose|color|version)' || true; }

check_page() { # PAGE
    "$mandoc" -Tlint -W warning "$manual/$1.1" || complain "$1: see above"
    local section
    for section in NAME SYNOPSIS DESCRIPTION OPTIONS 'EXIT STATUS' EXAMPLES 'SEE ALSO'; do
        [[ $section == OPTIONS && $1 == tavo ]] || grep -qx "\.Sh $section" "$manual/$1.1" ||
            complain "$1: no section $section"
    done
}

mapfile -t subcommands < <("$tavo" --help | sed -n '/^Subcommands:/,$s/^  \([a-z]*\) .*/\1/p')
((${#subcommands[@]} > 0)) || complain "tavo --help lists no subcommands"
check_page tavo
for name in "${subcommands[@]}"; do
    if [[ ! -f $manual/tavo-$name.1 ]]; then
        complain "no page for tavo $name"
        continue
    fi
    check_page "tavo-$name"
    grep -q "^\.Xr tavo-$name 1" "$manual/tavo.1" || complain "tavo.1 does not mention tavo-$name"
    mapfile -t verbs < <("$tavo" "$name" --help | sed -n '/^Subcommands:/,$s/^  \([a-z]*\) .*/\1/p')
    has=$(
        options_of "$name"
        for verb in "${verbs[@]}"; do options_of "$name" "$verb"; done
    )
    has=$(sort -u <<<"$has")
    told=$(grep -oE '^\.It .*Fl -[a-z]+' "$manual/tavo-$name.1" | grep -oE -- '-[a-z]+$' | sed 's/^/-/' | sort -u || true)
    [[ $has == "$told" ]] || complain "tavo-$name.1 describes '${told//$'\n'/ }', but there are '${has//$'\n'/ }'"
done
# Other commands have pages here, too.
mapfile -t pages < <(grep -lE '^\.Nm tavo [a-z]' "$manual"/tavo-*.1)
for page in "${pages[@]}"; do
    name=${page##*/tavo-}
    [[ " ${subcommands[*]} " == *" ${name%.1} "* ]] || complain "${page##*/} is of no subcommand"
done
exit "$status"
