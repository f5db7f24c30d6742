#!/usr/bin/env bash
# Boots the kernel that cmake/sysroot.sh unpacked, in QEMU, and returns when the guest takes tests. It ends by itself
# after the time given.
#
#   boot.sh ARCHITECTURE PACKAGES ROOT GUEST SECONDS
#
# PACKAGES is where the kernel's packages are unpacked, ROOT the system whose libraries the tests need ("/" for the
# machine's own), GUEST a folder for the guest's files. $TAVO_GUEST_SLOTS tests can run at a time.
set -euo pipefail
here=$(dirname "$(readlink -f "$0")")
architecture=$1 packages=$2 root=$3 guest=$4 seconds=$5
project=$(readlink -f "$here/../..")
slots=2

die() {
    printf 'boot.sh: %s\n' "$1" >&2
    exit 1
}

case $architecture in
    amd64) machine=(qemu-system-x86_64 -machine pc) console=ttyS0 ;;
    armhf) machine=(qemu-system-arm -machine virt,highmem=off -cpu cortex-a15) console=ttyAMA0 ;;
    *) die "no machine is known for $architecture" ;;
esac
modules=(virtio_pci virtio_console 9pnet_virtio 9p overlay binder_linux)

rm -rf "$guest"
mkdir -p "$guest"
kernel=$(echo "$packages"/boot/vmlinuz-*)
[[ -e $kernel ]] || die "there is no kernel in $packages/boot"
version=${kernel##*/vmlinuz-}

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
    {
        printf 'project=%q slots=%q driver=%q servicemanager=%q\n' "$project" "$slots" \
            "${TAVO_GUEST_DRIVER-kernel}" "${TAVO_GUEST_SERVICEMANAGER-}"
    } >"$tree/settings"
    chmod 0755 "$tree/init"
    (cd "$tree" && find . | cpio --quiet -o -H newc --owner=0:0) >"$guest/initramfs.cpio"
}
make_initramfs

share() { # NAME FOLDER
    arguments+=(-fsdev "local,id=$1,path=$2,security_model=none,readonly=on,multidevs=remap"
        -device "virtio-9p-pci,fsdev=$1,mount_tag=$1")
}
arguments=("${machine[@]}" -accel tcg,thread=multi -smp "$slots" -m 1024 -nodefaults -no-user-config -no-reboot -display none
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

timeout --signal=KILL "$seconds" "${arguments[@]}" </dev/null >"$guest/qemu" 2>&1 &
echo $! >"$guest/pid"
for ((slot = 0; slot < slots; ++slot)); do
    exec {output}<>"$guest/slot$slot.out"
    until read -r -t 1 -u "$output" line && [[ $line == "=== ready" ]]; do
        kill -0 "$(<"$guest/pid")" 2>/dev/null || {
            cat "$guest/qemu" "$guest/console" >&2
            die "the guest ended before it was ready: its last words are above"
        }
    done
done
