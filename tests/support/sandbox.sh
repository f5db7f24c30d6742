#!/usr/bin/env bash
# Runs one program in a mount namespace of its own: an empty /sdcard and an empty runtime directory, so
# that tests neither see nor touch the machine's, nor each other's. Works as root and as an ordinary user.
#
#   sandbox.sh PROGRAM [ARGUMENT ...]
set -euo pipefail

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
    --unsetenv LOG_PREF --die-with-parent -- "$@"
