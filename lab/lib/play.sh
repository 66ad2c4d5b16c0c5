# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# The framework of scenes with two appliances: their own lab, taken down at the end, in which node 1
# pairs with node 2, whose administrator is "replica". Runs commands and checks their outcome.

lab=$(dirname "$(readlink -f "${BASH_SOURCE[0]}")")/../lab
# shellcheck source=lab/lib/ports.sh
. "${lab%/lab}/lib/ports.sh"
# shellcheck source=lab/lib/trace.sh
. "${lab%/lab}/lib/trace.sh"
work=$(mktemp -d /tmp/ove.XXXXXX)
export OVRADR_LAB_DIR=$work/lab
finish() {
    "$lab" down >/dev/null 2>&1 || true
    rm -rf "$work"
}
trap finish EXIT

fail() {
    trace "FAILED: $1"
    printf -- '--- last output:\n%s\n' "${output-}"
    for node in 1 2; do
        printf -- '--- log of node %s:\n' "$node"
        "$lab" log "$node" | tail -n 15 || true
    done
    exit 1
}

# A command failed unexpectedly. In a subshell the enclosing command decides.
set -E
trap '((BASH_SUBSHELL)) || fail "exit code $? of: $BASH_COMMAND"' ERR

# on NODE CODE COMMAND...: runs a command on a node and expects its exit code; sets output.
on() {
    local node=$1 wanted=$2 code=0
    shift 2
    output=$("$lab" run "$node" -- timeout 60 "$@" 2>&1 </dev/null) || code=$?
    ((code == wanted)) || fail "exit code $code instead of $wanted: $*"
}
# value FILTER: the result of jq on the last output.
value() { jq -er "$1" <<<"$output"; }
# holds FILTER: the last output is JSON for which FILTER is true.
holds() { jq -e "$1" <<<"$output" >/dev/null 2>&1 || fail "the output does not hold: $1"; }
says() { [[ $output == *"$1"* ]] || fail "the output does not say \"$1\""; }
logSays() { "$lab" log "$1" | grep -qF -- "$2" || fail "the log of node $1 does not say \"$2\""; }

password=correct-horse-battery
account=replica
# up: starts $nodes nodes, two by default.
up() {
    local way
    way=$("$lab" way)
    takePorts "${way%%:*}"
    "$lab" up "${nodes-2}" >/dev/null || fail "the lab does not come up"
    url=https://$("$lab" addr 2):5001
    on 1 0 sh -c "umask 077; printf %s '$password' >/usr/ovra/pw"
    on 2 0 sh -c "umask 077; printf %s '$password' >/usr/ovra/pw"
    on 2 0 ovradr user add replica --admin --password-file /usr/ovra/pw
    on 2 0 ovradr --json node id
    remote=$(value .data.node_id)
    key=$(fingerprint 2)
}
# fingerprint NODE [PROTOCOL]: the fingerprint of the node's key for HTTPS, or for PROTOCOL.
fingerprint() {
    "$lab" run "$1" -- ovradr --json conn local |
        jq -er --arg protocol "${2-https}://" 'first(.data.conns[] | select(.endpoint | startswith($protocol))).fingerprint'
}
create() {
    local code=$1
    shift
    on 1 "$code" ovradr cred create "$url" --account "$account" --password-file /usr/ovra/pw \
        --fingerprint "$key" "$@"
}
info() { on 1 "$1" ovradr call "$remote" OVRA.DR.Node info; }

# signalDaemon SIGNAL: to the daemon of node 2 only: with proot every process of the machine is
# visible, including those of other labs and of a real appliance. False if there is none.
signalDaemon() {
    # shellcheck disable=SC2016 # expanded in the node
    "$lab" run 2 -- bash -c '
        found=1
        for pid in $(pgrep -x ovradrd); do
            for mark in "OVRADR_LAB_ID=$OVRADR_LAB_ID" "OVRADR_LAB_NODE=$OVRADR_LAB_NODE"; do
                grep -sqzxF "$mark" "/proc/$pid/environ" || continue 2
            done
            kill -s "$1" "$pid" && found=0
        done
        exit "$found"' signal "$1"
}
stopDaemon() { signalDaemon TERM || fail "no daemon to stop"; waitGone; }
waitGone() {
    for _ in $(seq 50); do
        signalDaemon 0 || return 0
        sleep 0.1
    done
    fail "ovradrd does not end"
}
# In the background of the node, as its init would; the lab ends it. Node 1 is not notified.
startDaemon() {
    waitGone
    "$lab" run 2 -- sh -c 'ovradrd >/tmp/ovradrd.out 2>&1 &'
    for _ in $(seq 100); do
        "$lab" run 2 -- ovradr conn test "$url" >/dev/null 2>&1 && return
        sleep 0.1
    done
    fail "ovradrd does not come back"
}
restartDaemon() {
    stopDaemon
    startDaemon
}
