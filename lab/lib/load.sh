#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# load.sh CLIENTS COUNT PAUSE FOLDER COMMAND...: inside a node, CLIENTS concurrent processes run
# COMMAND COUNT times each (0: until FOLDER/stop exists), with PAUSE seconds in between. Every run is
# a line in FOLDER/runs: start and duration in microseconds, and exit code.
set -euo pipefail
clients=$1 count=$2 pause=$3 folder=$4
shift 4
mkdir -p "$folder"
rm -f "$folder/stop" "$folder/runs"

client() {
    local i start code
    for ((i = 0; (count == 0 || i < count) && i < 10000; i++)); do
        [[ ! -e $folder/stop ]] || return 0
        start=${EPOCHREALTIME/./} code=0
        "$@" >/dev/null 2>&1 || code=$?
        printf '%d %d %d\n' "$start" $((${EPOCHREALTIME/./} - start)) "$code" >>"$folder/runs"
        sleep "$pause"
    done
}

for ((n = 0; n < clients; n++)); do
    client "$@" &
done
wait
