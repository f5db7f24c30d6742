#!/usr/bin/env bash
# Every function of the C library that takes a path, and that the library calls, is one the testing kit redirects.
#
#   check_path_calls.sh NM LIBRARY SOURCE
set -euo pipefail

nm=$1 library=$2 source=$3
names='(f?re)?open(at)?|fopen|creat|access|faccessat|eaccess|l?chown|fchownat|chmod|fchmodat|[l]?stat|fstatat|statx?|mkdir(at)?'
names+='|mknod(at)?|mkfifo(at)?|rmdir|unlink(at)?|remove|rename(at2?)?|link(at)?|symlink(at)?|readlink(at)?|truncate|opendir'
names+='|scandir|ftok|statv?fs|utimes?|realpath|chdir|__open(at)?(64)?_2|__l?xstat(64)?|mkstemp|mkdtemp'

status=0
for name in $("$nm" -D --undefined-only "$library" | sed -E 's/.* U //; s/@.*//' | grep -xE "($names)(64)?"); do
    grep -q "{\"$name\"," "$source" || { echo "not redirected: $name"; status=1; }
done
exit "$status"
