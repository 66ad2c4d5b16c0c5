# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# shellcheck disable=SC2034,SC2154 # of lab/lib/play.sh and lab/scene
# The scene attack-slow: slow clients of a daemon, and one address that takes all it can of the relay.
# Node 1 calls node 3 over the relay of node 2; node 4 attacks.
nodes=4

# attack WORDS...: runs slow.pl on node 4 in the background.
attack() {
    "$lab" run 4 -- perl "$here/lib/slow.pl" "$@" >"$work/attack" 2>&1 </dev/null &
    attacker=$!
}

playAttack-slow() {
    local each server longestLife attacker aliasPort
    [[ $(<"$OVRADR_LAB_DIR/way") != proot ]] || {
        echo "skipped: nodes made by proot all have one address"
        exit 77
    }
    echo "  slow clients of a daemon, 40 of each kind:"
    pairAs replica "https://$("$lab" addr 2):5001"
    attack lives "$("$lab" addr 2)" 5000 5001 40
    startLoad "$clients" 0
    wait "$attacker" || fail "the attack does not work: $(cat "$work/attack")"
    endLoad
    report
    noneFailed
    while read -r each longestLife; do
        atMost "longest life, slow in its $each" "$longestLife" "$(plus 16 "$slack")" " s"
    done <"$work/attack"

    echo "  one address takes what it can of the relay:"
    server=https://$("$lab" addr 2)
    "$lab" run 2 -- sh -c 'farlinkd >/tmp/farlinkd.out 2>&1 &'
    for _ in $(seq 100); do
        key=$("$lab" run 2 -- sed -n 's/^farlinkd: key //p' /tmp/farlinkd.out)
        [[ -z $key ]] || break
        sleep 0.1
    done
    on 3 0 sh -c "umask 077; printf %s '$password' >/usr/ovra/pw"
    on 3 0 ovradr user add replica --admin --password-file /usr/ovra/pw
    on 3 0 ovradr farlink enable --server "$server" --alias nas-3 --fingerprint "$key"
    on 1 0 ovradr farlink enable --server "$server" --fingerprint "$key"
    key=$(fingerprint 3) url=flk:nas-3 account=replica
    create 0 --json
    on 3 0 ovradr --json node id
    remote=$(value .data.node_id)
    startLoad 1 40
    waitLoad
    line "calls answered before the attack" "$answered of $sent" "longest $longest s"
    noneFailed
    aliasPort=$("$lab" run 2 -- awk 'NR == 2 { print $2 }' /usr/ovra/var/farlinkd/aliases)
    attack holds "$("$lab" addr 2)" 600 5444 "$aliasPort"
    sleep 3
    startLoad 1 40
    waitLoad
    line "calls answered under attack" "$answered of $sent" "longest $longest s"
    kill "$attacker" 2>/dev/null || true
    ((answered * 10 >= sent * 9)) || fail "fewer than 90 % of the honest calls got through"
}
