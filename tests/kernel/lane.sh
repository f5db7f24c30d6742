#!/usr/bin/env bash
# Runs the tests labelled `kernel` of one build on the kernel's binder driver, in a guest with Debian's own kernel. CTest
# runs on the machine, and its report and exit status are this script's.
#
#   lane.sh PRESET [CTEST OPTION ...]
#
# Exit status 77: the kernel's packages cannot be had.
set -euo pipefail
cd "$(dirname "$(readlink -f "$0")")/../.."
preset=$1
shift

# With another processor emulated every test takes several times as long: there, what goes from end to end has to do.
end_to_end='\.(BinderRemote|DriverCall|DriverDeath|KernelMachine|MsgQueueByKey|OsalInit|QueueProcesses|RemoteQueue|SharedMemory|SharedMemoryProcesses)\.'
case $preset in
    armhf)
        architecture=armhf kernel=linux-image-armmp root=$PWD/build/sysroot/armhf
        selection=(--tests-regex "$end_to_end")
        ;;
    *) architecture=$(dpkg --print-architecture) kernel=linux-image-$architecture root=/ selection=() ;;
esac
packages=$PWD/build/kernel/$architecture
guest=$PWD/build/kernel/guest-$preset

cmake/sysroot.sh "$architecture" "$packages" "$kernel" busybox-static
# The lock is free when the guest is gone.
trap 'kill "$(<"$guest/pid")" 2>/dev/null && flock -w 10 "$guest/running" true || true' EXIT
started=$SECONDS
tests/kernel/boot.sh "$architecture" "$packages" "$root" "$PWD/build/$preset" "$guest"
echo "The guest took $((SECONDS - started)) seconds to start $(<"$guest/version")."

status=0
TAVO_TEST_GUEST=$guest ctest --preset "$preset" --label-regex '^kernel$' "${selection[@]}" --parallel "$(<"$guest/slots")" "$@" || status=$?
if flock --shared --nonblock "$guest/running" true; then
    echo "lane.sh: the guest ended before the tests did" >&2
    status=1
fi
if [[ $status -ne 0 && -s $guest/console ]]; then
    echo "lane.sh: the last words of the guest's kernel:" >&2
    tail -n 40 "$guest/console" >&2
fi
exit "$status"
