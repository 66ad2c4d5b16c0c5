# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# The processes of one lab or sandbox, found by the id in their environment.

# labProcesses ID: the pids with the id in their environment, and those traced by a proot among them
# (a program started with an empty environment is still one of ours). Not the calling shell.
labProcesses() {
    local environ pid marked=" "
    while IFS= read -r environ; do
        pid=${environ#/proc/}
        marked+="${pid%/environ} "
    done < <(env -u OVRADR_LAB_ID grep -slzxF "OVRADR_LAB_ID=$1" /proc/[0-9]*/environ)
    [[ $marked != " " ]] || return 0
    tracedBy | env -u OVRADR_LAB_ID awk -v marked="$marked" -v self="$$" '
        $1 != self && (index(marked, " " $1 " ") || ($2 != 0 && index(marked, " " $2 " "))) { print $1 }'
}

# tracedBy: a line for each live process, with its pid and that of its tracer (0: none). grep reads
# the files, because it continues if a process ends meanwhile; awk would stop.
tracedBy() {
    env -u OVRADR_LAB_ID grep -sE '^(State|TracerPid):' /proc/[0-9]*/status |
        env -u OVRADR_LAB_ID awk -F '[/:[:space:]]+' '
            $5 == "State" { zombie = $6 ~ /[ZX]/ }
            $5 == "TracerPid" && !zombie { print $3, $6 }' || true
}

# killLab ID: kills them all, repeatedly, until none is left; false if some survive 5 seconds.
killLab() {
    local pids round
    for ((round = 0; round < 100; round++)); do
        mapfile -t pids < <(labProcesses "$1")
        ((${#pids[@]})) || return 0
        kill -KILL "${pids[@]}" 2>/dev/null || true
        sleep 0.05
    done
    return 1
}

# removeTree FOLDER: removes it with its contents, including folders without permissions.
removeTree() {
    rm -rf -- "$1" 2>/dev/null && return 0
    chmod -R u+rwX -- "$1" 2>/dev/null || true
    rm -rf -- "$1"
}
