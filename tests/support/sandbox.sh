#!/usr/bin/env bash
# Runs one program in a mount namespace of its own: an empty /sdcard and an empty runtime directory, so
# that tests neither see nor touch the machine's, nor each other's. Works as root and as an ordinary user.
# Where $TAVO_TEST_GUEST names a running guest (tests/kernel/boot.sh), the program runs there.
#
#   sandbox.sh PROGRAM [ARGUMENT ...]
set -euo pipefail
[[ -z ${TAVO_TEST_GUEST-} ]] || exec "$(dirname "$0")/../kernel/in_guest.sh" "$@"

mounts=()
for entry in /*; do
    if [[ -L $entry ]]; then
        mounts+=(--symlink "$(readlink "$entry")" "$entry")
    elif [[ $entry == /dev ]]; then
        mounts+=(--dev-bind /dev /dev)
    elif [[ $entry != /sdcard ]]; then
        mounts+=(--bind "$entry" "$entry")
    fi
done
# /tmp stays the machine's (build trees may live there), so the runtime directory is a mount of its own.
exec bwrap "${mounts[@]}" --tmpfs /sdcard --tmpfs /run \
    --dir /run/binder --chmod 0700 /run/binder --setenv BINDER_RUNTIME_DIR /run/binder \
    --setenv BINDER_DRIVER "${TAVO_TEST_DRIVER-socket}" \
    --unsetenv LOG_PREF --die-with-parent -- "$@"
