#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# node.sh FOLDER NODE: the first program inside a node. Sets up its links, its system log and the
# appliance, reports the result in FOLDER/nNODE/state, and then waits for commands.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/common.sh
. "$lib/common.sh"

lab=$1
node=$2
own=$lab/n$node
way=$(<"$lab/way")
# How long the daemon may take to answer on both ports.
startSeconds=30
daemon=0
export OVRADR_LAB_NODE=$node

exec >"$own/console" 2>&1

# say STATE [WHY]: replaces the state file atomically, as others read it at any time.
say() {
    printf '%s\n' "$*" >"$own/state.new"
    mv "$own/state.new" "$own/state"
}

plugIn() {
    ip -batch - <<-END
	address add $(nodeAddress "$way" "$node" 0)/24 dev eth0
	address add $(nodeAddress "$way" "$node" 1)/24 dev eth1
	link set eth0 up
	link set eth1 up
	END
}

startLog() {
    local i
    perl "$labLib/collector.pl" "$own/log" &
    for ((i = 0; i < 200; i++)); do
        [[ ! -S /dev/log ]] || return 0
        sleep 0.02
    done
    echo "the log collector does not listen on /dev/log"
    return 1
}

# answers: whether the daemon gives any HTTP answer on both ports.
answers() {
    local address url
    address=$(nodeAddress "$way" "$node" 0)
    for url in "https://$address:5001" "http://$address:5000"; do
        curl --silent --insecure --noproxy '*' --max-time 2 --output /dev/null \
            "$url/webapi/query.cgi" || return 1
    done
}

startDaemon() {
    local deadline
    ovradr setup --hostname "node-$node" --serial "$(printf 'LAB%07d' "$node")" \
        --address "$(nodeAddresses "$way" "$node")" || {
        say "failed: ovradr setup returned $?"
        return 1
    }
    ovradrd &
    daemon=$!
    deadline=$((SECONDS + startSeconds))
    until answers; do
        if ! kill -0 "$daemon" 2>/dev/null; then
            wait "$daemon" && code=0 || code=$?
            say "failed: ovradrd ended with exit code $code"
            return 1
        fi
        if ((SECONDS >= deadline)); then
            say "failed: ovradrd did not answer on its ports within $startSeconds seconds"
            return 1
        fi
        sleep 0.05
    done
}

stopDaemon() {
    local i
    ((daemon)) || return 0
    kill -TERM "$daemon" 2>/dev/null || true
    for ((i = 0; i < 40; i++)); do
        kill -0 "$daemon" 2>/dev/null || return 0
        sleep 0.1
    done
}

say starting
[[ $way == proot ]] || plugIn || { say "failed: cannot set up the links"; exit 1; }
startLog || { say "failed: cannot collect the log"; exit 1; }
if [[ $(<"$lab/daemon") == yes ]]; then
    startDaemon || exit 1
fi
exec {orders}<>"$own/control"
say up
IFS= read -r -u "$orders" _
stopDaemon
say stopped
