#!/usr/bin/env bash
# Runs a command while a service has queues that fill, drain, stay nearly full or carry what comes, and some blocks. In
# the sandbox: the keys are everybody's.
#
#   busy.sh TAVO COMMAND [ARGUMENT ...]
set -euo pipefail
# Every job is a process group, which ends as one.
set -m
tavo=$1
shift

jobs=()
finish() {
    local job
    for job in "${jobs[@]}"; do kill -- "-$job" 2>/dev/null || true; done
    # Silently: that they were ended is no news.
    wait 2>/dev/null
}
trap finish EXIT

start() { # COMMAND [ARGUMENT ...]: in the background, and silent
    "$@" </dev/null >/dev/null 2>&1 &
    jobs+=($!)
}

text() { printf "%*s" "$1" '' | tr ' ' x; } # BYTES

feed() { # KEY BYTES SECONDS: a message so often, by one sender
    while text "$2" && echo && sleep "$3"; do :; done | "$tavo" send --lines --file - -- "$1"
}

take() { # KEY SECONDS: a message so often
    while "$tavo" recv "$1" && sleep "$2"; do :; done
}

fill() { # KEY MESSAGES BYTES: all of them now
    local i
    for ((i = 0; i < $2; i++)); do text "$3" && echo; done | "$tavo" send --timeout 5 --lines --file - -- "$1"
}

start "$tavo" serve
# A service that is starting is not there yet.
for _ in {1..100}; do
    "$tavo" ping --count 1 >/dev/null 2>&1 && break
    sleep 0.1
done

fill 7 3 1000
start feed 7 1000 0.1
start take 7 0.1
fill 8 20 700
start feed 8 700 0.2
fill 21 44 1000
start take 21 0.3
fill 40 15 4091
fill 305 1 24
"$tavo" shm create 9 16M >/dev/null
"$tavo" shm create 10 64K >/dev/null
"$tavo" shm create 4096 3M >/dev/null

"$@"
