# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# shellcheck disable=SC2034,SC2154 # of lab/lib/play.sh and lab/scene
# The scene attack-relay: the relay service of node 2, by which node 1 calls node 3, turns hostile. It names
# another port for the alias, where an appliance of its own answers: the daemon of node 2.
nodes=3

# startRelay ARGUMENT...: the relay service; sets key.
startRelay() {
    on 2 0 sh -c "farlinkd --address $("$lab" addr 2) $* >/usr/ovra/relay.out 2>&1 &
        echo \$! >/usr/ovra/relay.pid"
    for _ in $(seq 100); do
        key=$("$lab" run 2 -- sed -n 's/.*key //p' /usr/ovra/relay.out)
        [[ -z $key ]] || return 0
        sleep 0.1
    done
    fail "farlinkd does not start"
}
# leadsTo KEY: waits until who asks for the alias meets that key.
leadsTo() {
    for _ in $(seq 300); do
        output=$("$lab" run 1 -- ovradr conn test flk:nas-3 2>&1) || true
        [[ $output != *"$1"* ]] || return 0
        sleep 0.1
    done
    fail "the relay service does not lead to $1"
}
# refused WHAT COMMAND...: a command on node 1, which has to end because of the key.
refused() {
    local what=$1
    shift
    sleep "$(plus "$lifetime" 0.5)" # no verdict is left
    on 1 6 "$@"
    line "$what" refused
}

playAttack-relay() {
    local server own file=/usr/ovra/var/farlinkd/aliases vouched=(unshare --mount sh -c
        'mount --bind /usr/ovra/certs /etc/ssl/certs && exec "$@"' vouched)
    server=https://$("$lab" addr 2) own=$(fingerprint 2)
    startRelay
    on 3 0 sh -c "umask 077; printf %s '$password' >/usr/ovra/pw"
    on 3 0 ovradr user add replica --admin --password-file /usr/ovra/pw
    on 3 0 ovradr farlink enable --server "$server" --alias nas-3 --fingerprint "$key"
    on 1 0 ovradr farlink enable --server "$server" --fingerprint "$key"
    key=$(fingerprint 3) url=flk:nas-3 account=replica
    leadsTo "$key"
    create 0 --json
    credId=$(value .data.cred_id)
    on 3 0 ovradr --json node id
    remote=$(value .data.node_id)
    info 0
    line "a call over the honest relay" answered

    on 2 0 sh -c "kill \$(cat /usr/ovra/relay.pid); sleep 1; sed -i '2s/ [0-9]* / 5001 /' $file"
    startRelay --first-port 5001 --last-port 5001
    leadsTo "$own"
    key=$(fingerprint 3)
    refused "a call that the relay leads elsewhere" ovradr call "$remote" OVRA.DR.Node info
    refused "a test of the credential" ovradr cred test "$credId"
    refused "a log-in" ovradr cred set "$credId" --account replica --password-file /usr/ovra/pw

    "$lab" run 2 -- cat /usr/ovra/etc/ovradr/ovradrd.crt >"$work/certificate"
    on 1 0 sh -c "mkdir /usr/ovra/certs && printf '%s\n' '$(<"$work/certificate")' >/usr/ovra/certs/relay.pem"
    on 1 0 openssl rehash /usr/ovra/certs
    if "$lab" run 1 -- "${vouched[@]}" true 2>/dev/null; then
        on 1 0 "${vouched[@]}" ovradr conn test "https://$("$lab" addr 2):5001"
        says "by the certificates that this system trusts"
        refused "the same, to a key that the system trusts" \
            "${vouched[@]}" ovradr call "$remote" OVRA.DR.Node info
    else
        line "a key that the system trusts" - "(not to be had here)"
    fi
    ! "$lab" log 2 | grep -E '(OVRA\.DR|login).*(refused|code)' || fail "something was sent there"
    line "calls and log-ins that came there" 0
}
