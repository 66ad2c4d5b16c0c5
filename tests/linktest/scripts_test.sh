#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Usage: lab/sandbox -- scripts_test.sh SCRIPTS: the two scripts of the speed test, with a network and
# a clock of their own.
set -uo pipefail
scripts=$1
folder=/usr/ovra/var/ovradr/speedtest
failed=0
# expect WHAT CONDITION...
expect() { "${@:2}" || { echo "not so: $1"; failed=1; }; }
# fake PROGRAM LINES
fake() { printf '#!/bin/sh\n%s\n' "$2" >"/tmp/fake/$1" && chmod +x "/tmp/fake/$1"; }
download() { PATH=/tmp/fake:$PATH "$scripts/TestDownloadSpeed.sh" http://h/ "$@" 2>/dev/null; }
setup() { PATH=/tmp/fake:$PATH "$scripts/TestSyncSpeed.sh" setup 2>/dev/null; }
mkdir /tmp/fake

fake curl 'echo "figures 1000000 0.1 0.2" >&2'
expect "numbers of any length count" [ "$(download 99999999999999999999 00000000000)" = "80.0 Mbit/s" ]
expect "a number has digits only" [ -z "$(download 1x 3)" ]
fake curl 'echo >>/tmp/calls; exit 7'
fake date 'echo $((1000000000 - $(wc -l </tmp/calls) * 100))'
touch /tmp/calls
download 10 2
expect "a clock that is set back does not lengthen the test" [ "$(wc -l </tmp/calls)" -lt 6 ]

file=$(setup)
expect "the file that is printed is there" [ "$(stat -c %s "$file")" = 67108864 ]
rm "$file"
setup >&-
expect "nothing is left when the path cannot be printed" [ -z "$(ls "$folder")" ]
setup | :
expect "nothing is left when nobody reads the path" [ -z "$(ls "$folder")" ]
fake head 'kill -TERM $PPID; sleep 1'
setup >/dev/null
expect "nothing is left when it is ended" [ -z "$(ls "$folder")" ]
exit $failed
