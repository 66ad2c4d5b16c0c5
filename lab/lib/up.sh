# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# lab up: creates the folder, starts the keeper, waits for the nodes.

# More nodes are of no use on one machine, and addresses end at 254.
maxNodes=32
# How long a lab may take to come up; a node gives up earlier by itself.
upSeconds=90

labUp() {
    local count="" withDaemon=yes argument status i
    for argument; do
        case $argument in
        --no-daemon) withDaemon=no ;;
        *) count=$argument ;;
        esac
    done
    [[ $count =~ ^[1-9][0-9]?$ && $count -le $maxNodes ]] ||
        fail "say how many nodes, 1 to $maxNodes: lab up 2"
    labPrefix=$(readlink -f "${OVRADR_LAB_PREFIX:-$labRoot/build/stage}")
    if [[ $withDaemon == yes ]]; then
        checkPrograms
    fi
    needProgram jq jq
    pickLabWay || fail "$labWhy"
    echo "lab: $(wayText "$labWay"), because $labWhy"
    lab=$(labFolder)
    clearFolder
    [[ $labWay != proot ]] || checkProot "$count" "$withDaemon"
    makeFolder "$count" "$withDaemon"

    # If this script ends early for any reason, SIGKILL included, the end of the keeper's standard
    # input ends the lab.
    trap 'endEarly "interrupted" 130' INT
    trap 'endEarly "interrupted" 143' TERM
    trap 'endEarly "interrupted" 129' HUP
    exec {keeper}> >(exec setsid bash "$labLib/keeper.sh" "$lab" >"$lab/keeper.log" 2>&1)
    waitForNodes "$count" || endEarly "the lab did not come up"
    # Under load a daemon that has answered once may be slow to do it again.
    status=$(labStatus)
    for ((i = 1; i <= count; i++)); do
        if [[ $status =~ (^|$'\n')node-$i\ [^$'\n']*"$silentWord" ]]; then
            showNode "$i" "does not answer"
            endEarly "node-$i does not answer"
        fi
    done
    trap '' INT TERM HUP
    echo keep >&"$keeper"
    exec {keeper}>&- 9<&-
    trap - INT TERM HUP
    printf '%s\n' "$status"
}

# endEarly WHY [CODE]: takes down a lab that is coming up, and fails, with that exit code.
endEarly() {
    trap '' INT TERM HUP
    exec {keeper}>&- 9<&-
    local state="it was taken down again"
    waitUntilGone || state="and $lab is still there; end it with: lab down"
    (fail "$1; $state") || exit "${2-1}"
}

checkPrograms() {
    local program
    needProgram curl curl
    for program in ovradr ovradrd; do
        [[ -x $labPrefix/bin/$program || -x $labPrefix/sbin/$program ]] ||
            fail "$program is not installed in $labPrefix; build it with \"make stage\", or set OVRADR_LAB_PREFIX"
    done
}

# The limits of proot: a Unix socket's path is limited to 107 bytes, and proot prepends the node's
# root folder; the ports are this machine's.
checkProot() {
    local i port
    ((${#lab} <= 50)) ||
        fail "with proot the lab's folder can have a path of at most 50 characters; set OVRADR_LAB_DIR to a shorter one"
    [[ $2 == yes ]] || return 0
    for ((i = 1; i <= $1; i++)); do
        for port in 5000 5001; do
            if (exec 3<>"/dev/tcp/127.0.1.$i/$port") 2>/dev/null; then
                fail "port $port of 127.0.1.$i is in use, by another lab perhaps; with proot all share this machine's ports"
            fi
        done
    done
}

# clearFolder: fails if a lab is up, and removes one whose keeper was killed.
clearFolder() {
    [[ -e $lab || -L $lab ]] || return 0
    checkFolder "$lab"
    flock -n "$lab" true ||
        fail "a lab is up already in $lab; end it with \"lab down\", or set OVRADR_LAB_DIR for another"
    [[ -s $lab/id || -z $(ls -A "$lab") ]] ||
        fail "$lab holds something that is no lab; set OVRADR_LAB_DIR to another place"
    sweepLab
}

makeFolder() {
    local i
    mkdir -m 700 "$lab" || fail "cannot make the folder $lab; set OVRADR_LAB_DIR to another place"
    # The keeper holds it open while the lab is up.
    exec 9<"$lab"
    flock -n 9 || fail "another lab is coming up in $lab at this moment; try again"
    newId >"$lab/id"
    echo "$labWay" >"$lab/way"
    echo "$labPrefix" >"$lab/prefix"
    echo "$1" >"$lab/count"
    echo "$2" >"$lab/daemon"
    for ((i = 1; i <= $1; i++)); do
        mkdir "$lab/n$i"
        touch "$lab/n$i/log"
        mkfifo -m 600 "$lab/n$i/control"
        echo up | tee "$lab/n$i/link0" >"$lab/n$i/link1"
    done
}

# waitForNodes COUNT: prints the reason and the logs and returns false if one fails or the time is
# up.
waitForNodes() {
    local i up state deadline=$((SECONDS + upSeconds))
    while :; do
        up=0
        for ((i = 1; i <= $1; i++)); do
            state=$(nodeState "$lab" "$i")
            [[ $state != up ]] || up=$((up + 1))
            if [[ $state == failed* ]]; then
                showNode "$i" "$state"
                return 1
            fi
        done
        ((up < $1)) || return 0
        if [[ -s $lab/keeper.log ]]; then
            sed 's/^/lab: /' "$lab/keeper.log" >&2
            return 1
        fi
        if ((SECONDS >= deadline)); then
            echo "lab: only $up of $1 nodes came up within $upSeconds seconds" >&2
            return 1
        fi
        sleep 0.05
    done
}

# showNode NODE STATE: the last lines of a failed node's output.
showNode() {
    {
        echo "lab: node-$1 $2"
        tail -n 20 "$lab/n$1/console" | sed "s/^/node-$1: /"
        tail -n 20 "$lab/n$1/log" | sed "s/^/node-$1 log: /"
    } >&2
}
