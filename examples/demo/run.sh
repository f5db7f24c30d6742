#!/usr/bin/env bash
# Plays the demo. First act: a server, a receiver and a sender, three processes that share the queue of key 7. Second
# act: a producer and a consumer share the block of key 9, guarded by a semaphore in a file.
#
#   run.sh DIRECTORY_OF_THE_PROGRAMS DIRECTORY_FOR_OUTPUT
set -euo pipefail

programs=$1 output=$2
rm -rf "$output" && mkdir -p "$output"
pids=()
trap 'kill "${pids[@]}" 2>/dev/null || true' EXIT

start() { # ROLE: starts it with its output and its log in files of their own
    : >"$output/$1.out"
    # The programs may be another architecture's.
    # shellcheck disable=SC2086
    ${TAVO_EMULATOR-} "$programs/demo_$1" >"$output/$1.out" 2>"$output/$1.log" &
    pids+=($!)
}

wait_for() { # ROLE LINE
    for _ in $(seq 200); do
        grep -qx "$2" "$output/$1.out" && return 0
        kill -0 "${pids[-1]}" 2>/dev/null || break
        sleep 0.05
    done
    echo "the $1 did not get as far as '$2'; its log:" >&2
    cat "$output/$1.log" >&2
    exit 1
}

say() { printf '  %-9s %s\n' "$1" "$2"; }

echo "Three processes, one queue:"
start server
server=$!
wait_for server ready
say server "process $server published the service \"android.tavo.osal\""
start receiver
receiver=$!
wait_for receiver attached
say receiver "process $receiver attached to key 7"
start sender
sender=$!
wait_for sender attached
say sender "process $sender attached to key 7"

status=0
wait "$sender" || status=$?
wait "$receiver" || status=$?
say sender "$(grep '^sent' "$output/sender.out" || echo 'did not finish')"
say receiver "$(grep -E '^(got|message|the sender)' "$output/receiver.out" || echo 'did not finish')"
say receiver "$(grep 'a second$' "$output/receiver.out" || echo 'has nothing to report')"

echo
echo "Two more, and a shared block:"
start producer
producer=$!
wait_for producer 'holds the semaphore'
say producer "process $producer fills the 16 MiB block of key 9, holding semaphore 4660"
start consumer
consumer=$!
say consumer "process $consumer waits for the semaphore"
wait "$consumer" || status=$?
wait "$producer" || status=$?
say consumer "$(grep '^saw' "$output/consumer.out" || echo 'did not finish'), and said so through queue 8"
say producer "$(grep '^wrote' "$output/producer.out" || echo 'did not finish')"

echo
echo "What they logged at levels 1 to 3 (ordinary steps are marked E, too: the interface has them so):"
for role in server receiver sender producer consumer; do
    grep . "$output/$role.log" | sed -n "1,8s/^/  /p" >"$output/$role.shown"
    printf '  -- %s, %s lines, the first of them\n' "$role" "$(grep -c . "$output/$role.log")"
    cat "$output/$role.shown"
done
echo "All of it is in $output."
echo
if [[ $status -ne 0 ]]; then
    echo "Messages or blocks were lost or damaged: see $output" >&2
    exit 1
fi
echo "All messages and the block arrived intact."
