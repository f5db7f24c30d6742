#!/usr/bin/env bash
# Boots the kernel that cmake/sysroot.sh unpacked, in QEMU, and returns when the guest takes tests. It is ended after
# twenty minutes at the latest.
#
#   boot.sh ARCHITECTURE PACKAGES ROOT BUILD GUEST
#
# PACKAGES is where the kernel's packages are unpacked, ROOT the system whose libraries the tests need ("/" for the
# machine's own), BUILD where the tests were built, GUEST a folder for the guest's files. Whoever holds a lock on
# GUEST/running is the guest.
set -euo pipefail
here=$(dirname "$(readlink -f "$0")")
architecture=$1 packages=$2 root=$3 build=$4 guest=$5
project=$(readlink -f "$here/../..")
slots=2 # how many tests run at a time

die() {
    printf 'boot.sh: %s\n' "$1" >&2
    exit 1
}

# A second emulated ARM processor costs more than it does: each waits for the other whenever a mapping goes.
case $architecture in
    amd64) machine=(qemu-system-x86_64 -machine pc -smp 2) console=ttyS0 ;;
    armhf) machine=(qemu-system-arm -machine "virt,highmem=off" -cpu cortex-a15 -smp 1) console=ttyAMA0 ;;
    *) die "no machine is known for $architecture" ;;
esac
modules=(virtio_pci virtio_console 9pnet_virtio 9p overlay binder_linux)

rm -rf "$guest"
mkdir -p "$guest"
kernel=$(echo "$packages"/boot/vmlinuz-*)
[[ -e $kernel ]] || die "there is no kernel in $packages/boot"
version=${kernel##*/vmlinuz-}
servicemanager=$build/platform/linux/binder/servicemanager/servicemanager
[[ -x $servicemanager ]] || die "there is no service manager in $build"

# Whatever a module needs comes before it; the number keeps the order.
make_initramfs() {
    local tree=$guest/initramfs number=100 path
    [[ -e $packages/lib/modules/$version/modules.dep ]] || depmod -b "$packages" "$version"
    mkdir -p "$tree"/{bin,modules}
    cp "$packages/bin/busybox" "$tree/bin"
    cp "$here"/{init,serve,sandbox} "$tree"
    while read -r path; do
        cp "$path" "$tree/modules/$((number++))-${path##*/}"
    done < <(modprobe -d "$packages" -S "$version" --show-depends -a "${modules[@]}" |
        awk '$1 == "insmod" && !seen[$2]++ { print $2 }')
    printf '%s=%q ' project "$project" slots "$slots" servicemanager "$servicemanager" >"$tree/settings"
    chmod 0755 "$tree/init"
    (cd "$tree" && find . | cpio --quiet -o -H newc --owner=0:0) >"$guest/initramfs.cpio"
}
make_initramfs
echo "$version" >"$guest/version"
echo "$slots" >"$guest/slots"

share() { # NAME FOLDER
    arguments+=(-fsdev "local,id=$1,path=$2,security_model=none,readonly=on,multidevs=remap"
        -device "virtio-9p-pci,fsdev=$1,mount_tag=$1")
}
arguments=("${machine[@]}" -accel "tcg,thread=multi" -m 1024 -nodefaults -no-user-config -no-reboot -display none
    -kernel "$kernel" -initrd "$guest/initramfs.cpio"
    -append "console=$console panic=-1 oops=panic mitigations=off quiet"
    -serial "file:$guest/console" -device virtio-serial-pci)
share root "$root"
share project "$project"
for ((slot = 0; slot < slots; ++slot)); do
    : >"$guest/slot$slot"
    mkfifo "$guest/slot$slot".{in,out}
    arguments+=(-chardev "pipe,id=slot$slot,path=$guest/slot$slot" -device "virtserialport,chardev=slot$slot,name=slot$slot")
done

start() {
    exec {running}>"$guest/running"
    flock "$running"
    timeout --signal=KILL 1200 "${arguments[@]}" </dev/null >"$guest/qemu" 2>&1 &
    echo $! >"$guest/pid"
    exec {running}>&-
}

is_ready() { # whether every slot has said so, in time
    local slot output line deadline=$((SECONDS + 120))
    for ((slot = 0; slot < slots; ++slot)); do
        exec {output}<>"$guest/slot$slot.out"
        until read -r -t 1 -u "$output" line && [[ $line == "=== ready" ]]; do
            if flock --shared --nonblock "$guest/running" true; then
                cat "$guest/qemu" "$guest/console" >&2
                die "the guest ended before it was ready: its last words are above"
            fi
            if ((SECONDS > deadline)); then
                exec {output}>&-
                return 1
            fi
        done
        exec {output}>&-
    done
}

# An emulated machine stands still now and then before its kernel has said a word.
for attempt in 1 2 3; do
    start
    if is_ready; then exit 0; fi
    cat "$guest/console" >&2
    echo "boot.sh: the guest was not ready in time (attempt $attempt)" >&2
    kill "$(<"$guest/pid")" || true
    flock -w 10 "$guest/running" true || die "the guest cannot be ended"
done
die "the guest does not start"
