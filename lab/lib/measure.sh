# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# For scenes that bound what an attack costs.

# daemonMemory [NODE]: what the daemon of node 2 has in memory (RSS), in MiB. With proot every process is
# visible.
daemonMemory() {
    # shellcheck disable=SC2016 # expanded in the node
    "$lab" run "${1-2}" -- bash -c '
        for pid in $(pgrep -x ovradrd); do
            grep -sqzxF "OVRADR_LAB_ID=$OVRADR_LAB_ID" "/proc/$pid/environ" &&
                grep -sqzxF "OVRADR_LAB_NODE=$OVRADR_LAB_NODE" "/proc/$pid/environ" &&
                awk "/^VmRSS:/ { printf \"%.1f\\n\", \$2 / 1024 }" "/proc/$pid/status"
        done'
}
# bound WHAT FIGURE LIMIT [UNIT]: prints a figure, and notes if it exceeds its limit.
missed=
bound() {
    line "$1" "$2${4-}" "(at most $3${4-})"
    awk "BEGIN { exit !($2 <= $3) }" || missed+="$1: $2 is more than $3. "
}
# boundHeld NODE BEFORE LIMIT: bounds what the daemon of the node has in MiB more than before, when it has
# had a minute to give memory back (it looks every 20 s).
boundHeld() {
    local held k
    for k in $(seq 30); do
        held=$(plus "$(daemonMemory "$1")" "-$2")
        awk "BEGIN { exit !($held > $3) }" || break
        sleep 2
    done
    bound "of it kept within a minute" "$held" "$3" " MiB"
}
