#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# bodies.sh ATTACKERS URL FOLDER ADDRESS...: inside a node, ATTACKERS clients without a session post
# legal bodies of 1 MiB to URL over kept connections until FOLDER/stop exists, each from one of the
# ADDRESSes in turn. They run at a lower priority: an attacker would have a machine of its own.
# FOLDER/attack receives the HTTP status and the size of each answer.
set -eu
attackers=$1 url=$2 folder=$3
shift 3
addresses=("$@")
renice -n 10 $$ >/dev/null
{
    printf 'api=OVRA.DR.Node&version=1&method=info&_sid=none&x=[0'
    yes ,0 2>/dev/null | head -n 524200 | tr -d '\n'
    printf ']'
} >"$folder/body"
{
    printf 'silent\ninsecure\nheader = "Expect:"\ndata-binary = "@%s/body"\n' "$folder"
    printf 'write-out = "%%{http_code} %%{size_download}\\n"\noutput = /dev/null\nmax-time = 20\n'
} >"$folder/attacker"
: >"$folder/attack"

attacker() {
    local urls=() i
    for ((i = 0; i < 10; i++)); do
        urls+=(-o /dev/null "$url")
    done
    while [[ ! -e $folder/stop ]]; do
        stdbuf -oL curl --interface "$1" -K "$folder/attacker" "${urls[@]}" >>"$folder/attack" 2>/dev/null || true
    done
}
for ((n = 0; n < attackers; n++)); do
    attacker "${addresses[n % ${#addresses[@]}]}" &
done
wait
