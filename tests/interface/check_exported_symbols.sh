#!/usr/bin/env bash
# Compares what a shared library exports with a list: one name a line, C++ names demangled, in the byte order
# of `LC_ALL=C sort -u`. Fails and names each difference when there is one.
#
#   check_exported_symbols.sh NM LIBRARY LIST
set -euo pipefail
export LC_ALL=C

nm=$1 library=$2 list=$3

# "ADDRESS TYPE NAME", and the name of a demangled member has blanks of its own.
exported=$("$nm" -DC --defined-only "$library" | sed -E 's/^[0-9a-f]+ [A-Za-z] //' | sort -u)
listed=$(sort -u "$list")
if [[ -z $exported ]]; then
    echo "$library: no exported symbols found" >&2
    exit 1
fi

missing=$(comm -13 <(echo "$exported") <(echo "$listed"))
extra=$(comm -23 <(echo "$exported") <(echo "$listed"))
if [[ -n $missing ]]; then sed 's/^/missing: /' <<<"$missing"; fi
if [[ -n $extra ]]; then sed 's/^/exported but not listed: /' <<<"$extra"; fi
[[ -z $missing && -z $extra ]]
