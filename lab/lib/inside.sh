# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Entering a running lab. Requires needLab.

# enterLab COMMAND...: replaces this shell with COMMAND in the switches' namespace, as root of the
# lab.
enterLab() {
    local pid users=()
    pid=$(bwrapPid "$lab/init.json")
    [[ $labWay == root ]] || users=(--user --preserve-credentials)
    exec nsenter -t "$pid" "${users[@]}" -m -n -u -p -- "$@"
}

# enterNode NODE COMMAND...: replaces this shell with COMMAND in the node, in the current folder if
# the node has it, otherwise in /.
enterNode() {
    local number=$1
    shift
    export OVRADR_SANDBOX=yes OVRADR_LAB_WAY=$labWay OVRADR_LAB_ID=$labId OVRADR_LAB_NODE=$number
    PATH=$(insidePath "$labPrefix")
    export PATH
    if [[ $labWay == proot ]]; then
        mapfile -d '' -t viewArgs <"$lab/n$number/proot.args"
        local code=0
        prootRun "$lab/n$number" "$@" || code=$?
        exit "$code"
    fi
    # The pid in init's namespace, which the first step enters.
    local nodePid
    nodePid=$(bwrapPid "$lab/n$number/bwrap.json")
    enterLab nsenter -t "$nodePid" -m -n -u -p -- /bin/bash -c \
        'cd -- "$1" 2>/dev/null || cd /; shift; exec -- "$@"' node "$PWD" "$@"
}
