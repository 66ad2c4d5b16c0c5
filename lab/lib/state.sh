# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# The folder of a lab and its ownership. Contents:
#   id way prefix count daemon      one line each, written by `lab up`
#   keeper.pid keeper.log           the supervisor of the lab
#   init.json                       bubblewrap's report on the first process inside (not with proot)
#   nI/state                        starting, up, failed or stopped, and why
#   nI/log nI/console nI/control    system log, output of the programs, FIFO for commands
#   nI/link0 nI/link1               up, cut or dropping
# The keeper holds an exclusive flock on the folder itself while the lab is up.

# labFolder: the path of this user's lab.
labFolder() {
    local folder=${OVRADR_LAB_DIR:-/tmp/ovralab-$EUID}
    [[ $folder == /* ]] || folder=$PWD/$folder
    printf '%s' "$folder"
}

# checkFolder FOLDER: fails unless FOLDER is a private folder of this user.
checkFolder() {
    [[ -d $1 && ! -L $1 && -O $1 && $(stat -c %a "$1") == 700 ]] ||
        fail "$1 is not a private folder of this user: remove it, or set OVRADR_LAB_DIR to another place"
}

# needLab: sets lab, labWay, labPrefix, labCount and labId of the running lab, or fails.
needLab() {
    lab=$(labFolder)
    [[ -d $lab ]] || fail "no lab is up; start one with: lab up N"
    checkFolder "$lab"
    if [[ ! -s $lab/keeper.pid ]] || flock -n "$lab" true; then
        fail "the lab in $lab is gone or not up yet; clear it away with: lab down"
    fi
    # shellcheck disable=SC2034 # read by the callers
    labWay=$(<"$lab/way") labPrefix=$(<"$lab/prefix") labCount=$(<"$lab/count") labId=$(<"$lab/id")
}

# needNode NODE: sets node to its number; both 2 and node-2 are accepted.
needNode() {
    node=${1#node-}
    [[ $node =~ ^[1-9][0-9]?$ && $node -le $labCount ]] ||
        fail "there is no node \"$1\"; the nodes are 1 to $labCount"
}

# needLink LINK: sets link to 0 or 1; both 1 and eth1 are accepted.
needLink() {
    link=${1#eth}
    [[ $link == [01] ]] || fail "there is no link \"$1\"; the links are 0 (eth0) and 1 (eth1)"
}

# nodeState FOLDER NODE: the state written by the node.
nodeState() {
    local state=starting
    [[ ! -s $1/n$2/state ]] || state=$(<"$1/n$2/state")
    printf '%s' "$state"
}

# bwrapPid FILE: the pid that bubblewrap wrote with --info-fd; false if it has not yet.
bwrapPid() {
    local pid
    pid=$(jq -er '."child-pid"' "$1" 2>/dev/null) && [[ -n $pid ]] && echo "$pid" # an empty file is no error to jq
}

# stopNodes FOLDER COUNT: tells every node's daemon to exit, and waits up to 5 seconds for that.
stopNodes() {
    local i round waiting
    for ((i = 1; i <= $2; i++)); do
        # Opened read-write: a dead node must not block this.
        [[ ! -p $1/n$i/control ]] || echo stop 1<>"$1/n$i/control" || true
    done
    for ((round = 0; round < 50; round++)); do
        waiting=0
        for ((i = 1; i <= $2; i++)); do
            [[ $(nodeState "$1" "$i") != up* ]] || waiting=1
        done
        ((waiting)) || return 0
        sleep 0.1
    done
}
