#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# TestSyncSpeed.sh setup: makes a file for measuring a link and prints its name, the absolute path,
# without an end of line. ovradrd serves it at /webman/modules/ovradr/ followed by that path. Who is
# done with it removes it by that name; what was left behind is swept here. Prints nothing when no
# file can be made; standard error says why.
set -eu
umask 077

# ovradrd serves this folder and no other.
folder=/usr/ovra/var/ovradr/speedtest
size=67108864
# A file that is older than this was left behind, in minutes; and no more than so many at once.
age=60
most=4

fail() {
    printf 'TestSyncSpeed.sh: %s\n' "$*" >&2
    exit 1
}

# A killed process leaves its file behind, and so does a test of a node that is not known.
sweep() {
    find "$folder" -maxdepth 1 -type f -name 'speed-*' -mmin "+$age" -exec rm -f {} +
    find "$folder" -maxdepth 1 -type f -name 'speed-*' -printf '%T@ %p\n' | sort -rn |
        tail -n "+$most" | cut -d ' ' -f 2- | xargs -r rm -f
}

[ "$*" = setup ] || fail "usage: TestSyncSpeed.sh setup"
mkdir -p "$folder" || fail "cannot make $folder: run it as root"
if [ -L "$folder" ] || [ ! -O "$folder" ]; then
    fail "$folder is not a folder of this user: remove it"
fi
chmod 700 "$folder"
sweep
# Never the last free space of an appliance.
free=$(df --output=avail -B1 "$folder" | tail -n 1)
[ "$free" -gt $((size * 2)) ] || fail "too little space is free on the disk of $folder"
file=$folder/speed-$(od -An -N16 -tx1 /dev/urandom | tr -d ' \n')
trap 'rm -f "$file"' EXIT
# Random, so that nothing on the way can compress it.
head -c "$size" /dev/urandom >"$file" || fail "cannot write $file"
trap - EXIT
printf '%s' "$file"
