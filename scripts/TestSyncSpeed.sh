#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# TestSyncSpeed.sh setup: creates a file for a speed test and prints its absolute path without a
# newline. ovradrd serves it at /webman/modules/ovradr/ followed by that path. The caller removes it
# by that name; left-over files are removed here. If no file can be created, or its path cannot be
# printed, none is left and standard error says why.
set -eu
umask 077

# ovradrd serves this folder and no other.
folder=/usr/ovra/var/ovradr/speedtest
size=67108864
# Maximum age of a file in minutes, and maximum number of files.
age=60
most=4

fail() {
    printf 'TestSyncSpeed.sh: %s\n' "$*" >&2
    exit 1
}

# A killed process leaves its file behind, and so does a test with an unknown node.
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
# Never use up the last free space of an appliance.
free=$(df --output=avail -B1 "$folder" | tail -n 1)
[ "$free" -gt $((size * 2)) ] || fail "too little space is free on the disk of $folder"
file=$folder/speed-$(od -An -N16 -tx1 /dev/urandom | tr -d ' \n')
# Nobody else removes a file whose name was not printed. A signal exits, so that it is removed too.
trap 'rm -f "$file"' EXIT
trap 'exit 1' HUP INT PIPE TERM
# Random, so that nothing on the path can compress it.
head -c "$size" /dev/urandom >"$file" || fail "cannot write $file"
printf '%s' "$file" || fail "cannot print the path of $file: nobody reads it"
trap - EXIT
