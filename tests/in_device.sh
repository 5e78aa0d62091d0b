#!/usr/bin/env bash
# in_device.sh PROGRAM SCRIPT [DIRECTORY FILE...]: makes a device, with PROGRAM in it, and runs
# SCRIPT there; that begins with `. /device.sh || exit`, which ends it wherever else it is run. The
# device is a new directory, DIRECTORY or one that is removed afterwards, with copies of the FILEs
# and of the tools that a script needs, and is entered by chroot: nothing that a script does can
# reach what lies outside, and where chroot is refused nothing is done at all.
set -euo pipefail
umask 022
PATH=$PATH:/usr/sbin # where chroot and zic lie, which only root searches
program=$1 script=$2

# Another user than root is root in a user namespace of their own, or asks sudo.
refusals=''
for as_root in '' 'unshare --map-root-user' sudo; do
    refusals+=$($as_root chroot / true 2>&1)'; ' && break
done || {
    echo "a device is entered by chroot: run this as root, or where user namespaces or sudo are" \
        "allowed (${refusals//$'\n'/ })" >&2
    exit 1
}

if [[ $# -gt 2 ]]; then
    device=$3
    mkdir "$device"
else
    device=$(mktemp -d "${program%/*}/device.XXXXXX")
    trap 'rm -rf --one-file-system "$device"' EXIT
fi
mkdir "$device"/{bin,dev,proc,tmp}
touch "$device/dev/null" # which is empty too
cp "$program" "$device/mira_tzlinks"
cp "${0%/*}/device.sh" "${@:4}" "$device"
cat "$script" >"$device/script"
for tool in awk bash cat chmod cp date diff env find grep ln mkdir mkfifo readlink rm sed sort \
    stat strace touch tr xargs zic; do
    cp -L "$(command -v $tool)" "$device/bin"
done
for library in $(ldd "$program" "$device"/bin/* | grep -Eo '/[^ ]+\.so[^ ]*' | sort -u); do
    mkdir -p "$device${library%/*}"
    cp -L "$library" "$device$library"
done

enter=(chroot "$device" /bin/env -i PATH=/bin LC_ALL=C ASAN_OPTIONS=detect_leaks=0)
enter+=(/bin/bash -euo pipefail -c '. /script; ended')
if grep -q __asan_init "$program"; then
    $as_root unshare --mount true ||
        { echo "AddressSanitizer reads /proc, which takes a mount namespace here" >&2; exit 1; }
    # shellcheck disable=SC2016 # expanded by the inner shell
    bind='mount --rbind /proc "$0" && exec "$@"'
    enter=(unshare --mount sh -c "$bind" "$device/proc" "${enter[@]}")
fi
status=0
$as_root "${enter[@]}" || status=$?
[[ $as_root != sudo ]] || sudo chown -Rh "$EUID" "$device"
exit $status
