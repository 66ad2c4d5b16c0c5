# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# A scene for lab/scene: node 1 is paired with a node 2 that answers with 8 MiB.
# shellcheck source=lab/lib/measure.sh
. "$here/lib/measure.sh"

# Of a process that reads one reply of 8 MiB: the text, and the tree up to where its reader stops.
replyLimit=96 heldLimit=10
playAttack-reply() {
    local before peak sampler k
    url=http://$("$lab" addr 2):5000
    key=$(fingerprint 2 http)
    create 0 --json
    credId=$(value .data.cred_id)
    info 0
    before=$(daemonMemory 1)
    stopDaemon
    "$lab" run 2 -- sh -c "perl '$here/lib/hostile.pl' $("$lab" addr 2) 5000 >/tmp/hostile.out 2>&1 &"
    sleep "$(plus "$lifetime" 0.5)"

    # shellcheck disable=SC2016 # expanded in the node
    peak=$("$lab" run 1 -- bash -c '
        ovradr call --cred "$1" "$2" OVRA.DR.Node info >/usr/ovra/reply 2>&1 & pid=$!
        while status=$(cat "/proc/$pid/status" 2>/dev/null) && [[ $status == *VmHWM* ]]; do
            most=$(awk "/^VmHWM:/ { printf \"%.1f\", \$2 / 1024 }" <<<"$status")
        done
        wait $pid && code=0 || code=$?
        echo "$most $code"' call "$credId" "$remote")
    [[ ${peak#* } != 0 ]] || fail "a reply of 8 MiB of numbers is taken"
    on 1 0 cat /usr/ovra/reply
    [[ $output == *"too large"* ]] || missed+="It is not refused for its size: $output. "
    bound "memory of ovradr call" "${peak% *}" "$replyLimit" " MiB"

    (while sleep 0.05; do daemonMemory 1; done) >"$work/memory" &
    sampler=$!
    for k in 1 2 3 4 5; do
        "$lab" run 1 -- ovradr call local OVRA.DR.Node.Credential relay --param "cred_id=\"$credId\"" \
            --param 'webapi={"api":"OVRA.DR.Node","version":1,"method":"info","params":{}}' \
            >"$work/relayed.$k" 2>&1 &
    done
    sleep 6
    kill "$sampler"
    wait "$sampler" || true
    grep -l "too large" "$work"/relayed.? >/dev/null || missed+="The daemon takes it. "
    peak=$(sort -n "$work/memory" | tail -n 1)
    bound "growth of the daemon, five replies at once" "$(plus "$peak" "-$before")" $((5 * 64)) " MiB"
    boundHeld 1 "$before" "$heldLimit"
    [[ -z $missed ]] || fail "$missed"
}
