# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# The scene attack-login: strangers on node 3 guess at the account that node 1 uses on node 2, for a minute or
# OVRADR_ATTACK_SECONDS, and again after one restart for every 20 of them.

# loginBody PASSWORD: the form of a log-in.
loginBody() { printf 'api=OVRA.Core.Auth&version=1&method=login&account="%s"&passwd="%s"' "$account" "$1"; }
# strangers COUNT: that many addresses of node 3, which it gets where nodes have a network of their own.
strangers() {
    local own device i
    own=$("$lab" addr 3)
    [[ $own == 127.* ]] ||
        device=$("$lab" run 3 -- sh -c "ip -o -4 addr show to $own | awk '{ print \$2 }'")
    for ((i = 1; i <= $1; i++)); do
        printf '%s\n' "${own%.*}.$((100 + i))"
        [[ $own == 127.* ]] || printf 'address add %s/24 dev %s\n' "${own%.*}.$((100 + i))" "$device" >&3
    done 3>"$work/addresses" >"$work/strangers"
    [[ $own == 127.* ]] || "$lab" run 3 -- ip -batch - <"$work/addresses"
}
# guess SECONDS: 20 wrong log-ins a second in the background, from two addresses; endGuesses waits, and sets
# asked and checked, the number of passwords that were looked at.
guess() {
    "$lab" run 3 -- bash -c '
        for address in $1; do
            curl -sk --noproxy "*" --interface "$address" --rate 10/s -d "$2" -w "\n" "$3/webapi/query.cgi?[1-$4]" &
        done
        wait' guess "$(head -n 2 "$work/strangers" | tr '\n' ' ')" "$(loginBody wrong-wrong)" "$url" $(($1 * 10)) \
        >"$work/guesses" 2>&1 &
    guessPid=$!
}
endGuesses() {
    wait "$guessPid" || fail "the guesses could not be sent"
    asked=$(grep -c '"code"' "$work/guesses" || true)
    checked=$(grep -c '"code":400' "$work/guesses" || true)
}
# logIns COUNT: log-ins of the owner on node 1, one after the other; sets longest.
logIns() {
    local begun took
    longest=0
    for ((i = 0; i < $1; i++)); do
        begun=${EPOCHREALTIME/./}
        create 0
        took=$(seconds "$begun")
        longest=$(awk "BEGIN { print ($took > $longest ? $took : $longest) }")
    done
}

playAttack-login() {
    local limit patience lasting=${OVRADR_ATTACK_SECONDS:-60} round
    "$lab" run 3 -- curl --version >/dev/null 2>&1 || { echo "skipped: no curl" && exit 77; }
    strangers 100
    logIns 5
    line "owner's longest of 5 log-ins in peace" "$longest s"
    limit=$(awk "BEGIN { print 2 * $longest + $slack }")
    patience=$(awk "BEGIN { print 20 + 10 * $longest }")

    guess "$lasting"
    sleep 5 # what strangers may guess at once is gone
    logIns $((lasting * 2 / 3))
    line "owner's log-ins under 20 guesses a second" $((lasting * 2 / 3)) "all let in"
    atMost "the longest" "$longest" "$limit" " s"
    endGuesses
    line "guesses sent in $lasting s" "$asked"
    # 20 at once, and one every two minutes: 50 in an hour.
    atMost "passwords checked meanwhile" "$checked" 21

    for ((round = 0; round < (lasting + 19) / 20; round++)); do
        restartDaemon
        guess 5
        logIns 1
        endGuesses
        atMost "checked in 5 s after a restart" "$checked" 1
        atMost "owner's log-in meanwhile" "$longest" "$limit" " s"
    done

    # Guesses at many accounts keep the log-in queue full; most of the time is that of 200 clients on this
    # machine.
    "$lab" run 3 -- bash -c '
        while read -r address; do
            for i in 1 2; do
                curl -sk --noproxy "*" --interface "$address" -d "${1/\"replica\"/\"$address-$i\"}" "$2" -w "\n" &
            done
        done
        wait' flood "$(loginBody wrong-wrong)" "$url/webapi/query.cgi" <"$work/strangers" >"$work/guesses" 2>&1 &
    guessPid=$!
    sleep 1
    logIns 1
    endGuesses
    line "log-ins at once from 100 addresses" "$asked" "($checked checked)"
    atMost "owner's log-in meanwhile" "$longest" "$patience" " s"
}
