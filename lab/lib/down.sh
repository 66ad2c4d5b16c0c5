# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# lab down, lab status, lab run, lab log, lab addr.

# waitUntilGone: waits up to 15 seconds until the keeper has removed the lab.
waitUntilGone() {
    local i
    for ((i = 0; i < 300; i++)); do
        [[ -e $lab ]] || return 0
        sleep 0.05
    done
    return 1
}

# sweepLab: removes the remains of a lab whose keeper is dead.
sweepLab() {
    [[ ! -s $lab/id ]] || killLab "$(<"$lab/id")" || fail "processes of the lab in $lab survive SIGKILL"
    removeTree "$lab" || fail "cannot remove $lab"
}

# isKeeper PID: whether that process is the keeper of this lab, and not a later process with the
# same pid.
isKeeper() {
    local words=()
    [[ -n $1 ]] && mapfile -d '' -t words <"/proc/$1/cmdline" || return 1
    [[ ${words[1]-} == "$labLib/keeper.sh" && ${words[2]-} == "$lab" ]]
} 2>/dev/null

labDown() {
    local id="" keeper
    lab=$(labFolder)
    if [[ ! -e $lab && ! -L $lab ]]; then
        echo "lab: no lab is up"
        return
    fi
    checkFolder "$lab"
    [[ ! -s $lab/id ]] || id=$(<"$lab/id")
    if ! flock -n "$lab" true; then
        keeper=$(cat "$lab/keeper.pid" 2>/dev/null) || keeper=""
        isKeeper "$keeper" ||
            fail "the lab in $lab is coming up at this moment; interrupt that, or try again"
        kill -TERM "$keeper" 2>/dev/null || true
        if ! waitUntilGone; then
            kill -KILL "$keeper" 2>/dev/null || true
        fi
    fi
    [[ ! -e $lab ]] || sweepLab
    verifyGone "$id"
    echo "lab: down; no process, mount, interface or folder of it is left"
}

# verifyGone ID: looks for left-overs of a lab, and fails naming them.
verifyGone() {
    local left
    left=$(labProcesses "$1" | tr '\n' ' ')
    [[ -z $left ]] || fail "these processes of the lab are still there: $left"
    left=$(grep -F " $lab" /proc/self/mountinfo || true)
    [[ -z $left ]] || fail "these mounts of the lab are still there: $left"
    left=$(compgen -G '/sys/class/net/n[1-9]*e[01]' || true)
    [[ -z $left ]] || fail "these interfaces of the lab are still there: $left"
    [[ ! -e $lab ]] || fail "the folder $lab is still there"
}

labRun() {
    needLab
    needNode "${1-}"
    shift
    [[ ${1-} != -- ]] || shift
    (($#)) || fail "give the command to run: lab run $node -- COMMAND"
    enterNode "$node" "$@"
}

labLog() {
    needLab
    needNode "${1-}"
    case ${2-} in
    "") cat "$lab/n$node/log" ;;
    -f) exec tail -n +1 -F "$lab/n$node/log" ;;
    *) fail "lab log NODE [-f]" ;;
    esac
}

labAddress() {
    needLab
    needNode "${1-}"
    needLink "${2-0}"
    [[ $labWay != proot || $link == 0 ]] ||
        fail "with proot a node has one address only; a second link needs namespaces"
    nodeAddress "$labWay" "$node" "$link"
    echo
}

labStatus() {
    local i daemons format='%-8s %-21s  %-28s  %s\n'
    needLab
    daemons=$(<"$lab/daemon")
    # shellcheck disable=SC2059 # one format for header and rows
    printf "$format" NODE ADDRESS LINKS DAEMON
    for ((i = 1; i <= labCount; i++)); do
        # shellcheck disable=SC2059
        printf "$format" "node-$i" "$(nodeAddresses "$labWay" "$i")" "$(linkWords "$i")" \
            "$(daemonWord "$i" "$daemons")"
    done
}

linkWords() {
    if [[ $labWay == proot ]]; then
        echo "loopback"
    else
        echo "eth0 $(linkWord "$1" 0), eth1 $(linkWord "$1" 1)"
    fi
}

linkWord() {
    local shape=""
    [[ ! -s $lab/n$1/shape$2 ]] || shape=" ($(<"$lab/n$1/shape$2"))"
    echo "$(<"$lab/n$1/link$2")$shape"
}

silentWord="does not answer"

# daemonWord NODE YES-OR-NO: whether the node's daemon answers now, at each address and port, checked from
# inside.
daemonWord() {
    local address urls=()
    if [[ $2 == no ]]; then
        echo "none"
        return
    fi
    for address in $(nodeAddresses "$labWay" "$1" | tr , ' '); do
        urls+=("https://$address:5001/webapi/query.cgi" "http://$address:5000/webapi/query.cgi")
    done
    if (enterNode "$1" curl --silent --insecure --noproxy '*' --max-time 5 --fail-early "${urls[@]}") \
        >/dev/null 2>&1 </dev/null; then
        echo "https 5001, http 5000"
    else
        echo "$silentWord"
    fi
}
