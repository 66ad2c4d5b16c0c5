# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# A scene for lab/scene: 16 strangers post bodies of 1 MiB to node 2, while an honest client makes calls
# over a kept connection and others log in.
# shellcheck source=lab/lib/measure.sh
. "$here/lib/measure.sh"

# What the attack may cost on a machine that has time for it. One with fewer than four processors also
# carries the attackers and the clients, and another one may have other work: times may be longer there,
# twice, or as often as there are processes for each processor, at most four times.
callLimit=50 loginLimit=2 growthLimit=40 heldLimit=10
busy=$(awk -v processors="$(nproc)" '{
    busy = int($1 / processors + 0.99); least = processors < 4 ? 2 : 1
    print (busy < least ? least : busy > 4 ? 4 : busy) }' /proc/loadavg)

# Calls of the honest client, a hundred a second, for 15 seconds at most; prints the time of each in ms and its HTTP status.
kept() {
    "$lab" run 1 -- sh -c '
        for i in $(seq "$1"); do printf "url = %s/webapi/query.cgi\noutput = /dev/null\n" "$2"; done |
            timeout 15 stdbuf -oL curl -sk --rate 100/s --max-time 20 -H "Expect:" \
                -d "api=OVRA.DR.Node&version=1&method=info&_sid=$3" \
                -w "%{time_total} %{http_code} %{size_download}\n" -K - || [ $? -eq 124 ]' calls "$1" "$url" "$sid"
}
# quantiles CALLS: sets count, failed, median, p99 and longest in ms.
quantiles() {
    read -r count failed median p99 longest < <(sort -n <<<"$1" | awk '
        { time[NR] = $1 * 1000; if ($2 != 200 || $3 < 100) failed++ }
        END { printf "%d %d %.1f %.1f %.1f\n", NR, failed, time[int((NR + 1) / 2)],
                     time[int(NR * 0.99 + 0.5)], time[NR] }')
}
posted() { "$lab" run 1 -- wc -l "$load/attack" | cut -d ' ' -f 1; } # bodies of 1 MiB
logIn() {
    "$lab" run 1 -- curl -sk --max-time 20 -w '\n%{time_total}\n' "$url/webapi/query.cgi" \
        -d "api=OVRA.Core.Auth&version=1&method=login&account=%22replica%22&passwd=%22$password%22" || true
}

playAttack-bodies() {
    local sid before peak slowest=0 answer attack sampler k addresses=() way begun
    way=$(<"$OVRADR_LAB_DIR/way")
    for k in $(seq 16); do
        if [[ $way == proot ]]; then
            addresses+=("127.0.9.$k")
        else
            on 1 0 ip address add "10.77.0.$((100 + k))/24" dev eth0
            addresses+=("10.77.0.$((100 + k))")
        fi
    done
    sid=$(logIn | head -n 1 | jq -re '.data.sid // empty') || fail "the honest client cannot log in"
    quantiles "$(kept 300)"
    line "median of an honest call before" "$median ms"
    line "p99 of an honest call before" "$p99 ms"
    before=$(daemonMemory)
    line "memory of the daemon before" "$before MiB"

    ((busy == 1)) || line "times may be longer on this machine by" "$busy" "(processors, load)"
    on 1 0 mkdir -p "$load"
    "$lab" run 1 -- bash "$here/lib/bodies.sh" 16 "$url/webapi/query.cgi" "$load" "${addresses[@]}" &
    attack=$!
    for k in $(seq 100); do
        ! "$lab" run 1 -- test -s "$load/attack" || break
        sleep 0.2
    done
    on 1 0 test -s "$load/attack"
    begun=$(posted)
    (while sleep 0.2; do daemonMemory; done) >"$work/memory" &
    sampler=$!
    quantiles "$(kept 1000)"
    kill "$sampler"
    wait "$sampler" || true
    peak=$(sort -n "$work/memory" | tail -n 1)
    line "bodies posted meanwhile" "$(($(posted) - begun))"
    line "honest calls under attack" "$count"
    bound "of them failed" "$failed" 0
    line "median of an honest call" "$median ms"
    bound "p99 of an honest call" "$p99" $((callLimit * busy)) " ms"
    line "longest honest call" "$longest ms"
    bound "growth of the daemon" "$(plus "$peak" "-$before")" "$growthLimit" " MiB"
    for _ in 1 2 3 4 5; do
        answer=$(logIn)
        [[ $answer == *'"success":true'* ]] || missed+="A log-in is not answered: ${answer%%$'\n'*}. "
        slowest=$(printf '%s\n' "$slowest" "${answer##*$'\n'}" | sort -n | tail -n 1)
    done
    bound "slowest of five log-ins" "$slowest" $((loginLimit * busy)) " s"
    on 1 0 touch "$load/stop"
    wait "$attack" || true
    boundHeld 2 "$before" "$heldLimit"
    [[ -z $missed ]] || fail "$missed"
}
