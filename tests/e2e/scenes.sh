#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# scenes.sh SCENE: one scene with two appliances, run with the installed programs
# (OVRADR_LAB_PREFIX). Node 1 pairs with node 2, whose administrator is "replica".
set -euo pipefail
here=$(dirname "$(readlink -f "${BASH_SOURCE[0]}")")
: "${OVRADR_LAB_PREFIX:?is not set: give the folder into which the programs to be tested are installed, or run the scene by ctest}"
# shellcheck source=lab/lib/play.sh
. "$here/../../lab/lib/play.sh"

# remain NODE CREDENTIALS SESSIONS: how many credentials, including temporary ones, the node holds,
# and how many sessions it granted.
remain() {
    on "$1" 0 ovradr --json cred list --temp
    holds ".data.creds | length == $2"
    on "$1" 0 ovradr --json session list
    holds ".data.sessions | length == $3"
}

nodeDb=/usr/ovra/etc/ovradr/node.db
# at NODE: its endpoint.
at() { echo "https://$("$lab" addr "$1"):5001"; }
# admin NODE NAME: creates an administrator.
admin() { on "$1" 0 ovradr user add "$2" --admin --password-file /usr/ovra/pw; }
# soon COMMAND...: succeeds on node 1 within 30 seconds.
soon() {
    for _ in $(seq 60); do
        ! output=$("$lab" run 1 -- "$@" 2>&1) || return 0
        sleep 0.5
    done
    fail "not within 30 seconds: $*"
}

pairAndTalk() {
    create 0
    info 0
    holds ".node_id == \"$remote\""
    on 1 0 ovradr --json cred list --node "$remote"
    holds ".data.creds | length == 1 and (.[0].node_id == \"$remote\")"
    holds '[.. | objects | has("session")] | any | not'
    on 1 0 ovradr call local OVRA.DR.Node info
    holds ".node_id != \"$remote\""
    # Over plain HTTP everything secret is sealed.
    key=$(fingerprint 2 http) url=http://$("$lab" addr 2):5000
    on 1 0 ovradr conn test "$url"
    create 0
    info 0
    for node in 1 2; do
        ! "$lab" log "$node" | grep -qF "$password" || fail "the password is in a log"
    done
}

oneTimeCodeAndPassword() {
    local secret
    on 2 0 ovradr --json user totp replica --show
    secret=$(value .data.secret)
    create 5
    create 5 --otp 000000
    says "one-time code"
    create 0 --otp "$(oathtool --totp --base32 "$secret")"
    info 0
    on 1 0 sh -c "printf wrong-password >/usr/ovra/pw"
    create 4 --otp "$(oathtool --totp --base32 "$secret")"
    on 1 0 sh -c "printf %s '$password' >/usr/ovra/pw"
    on 2 0 ovradr user disable replica
    create 4
    info 8
    remain 1 1 0 # a refused log-in leaves no credential
}

changedCertificate() {
    create 0
    info 0
    on 2 0 sh -c 'rm /usr/ovra/etc/ovradr/ovradrd.key /usr/ovra/etc/ovradr/ovradrd.crt; ovradr setup'
    restartDaemon
    info 6
    says "key"
    create 6
    logSays 1 "cred error [6]"
}

deadEndpoint() {
    on 1 3 ovradr conn test "https://no-such-host.invalid:5001"
    url=${url/%5001/5999} create 3
    create 0
    stopDaemon
    info 3
    on 1 7 ovradr call 00000000-dead OVRA.DR.Node info
    startDaemon
    soon ovradr call "$remote" OVRA.DR.Node info # the verdict has a lifetime of five seconds
}

damagedDatabase() {
    create 0
    on 1 0 ovradr user add someone --password-file /usr/ovra/pw # makes a database of another schema
    on 1 0 cp "$nodeDb" /usr/ovra/keep.db
    for damage in "rm $nodeDb" ": >$nodeDb" "printf rubbish-%5000d 0 >$nodeDb" \
        "rm $nodeDb; cp /usr/ovra/var/ovradr/accounts.db $nodeDb"; do
        on 1 0 sh -c "$damage"
        on 1 9 ovradr cred list
        output=$("$lab" run 1 -- ovradr call "$remote" OVRA.DR.Node info 2>&1) && fail "call without a database"
        on 1 0 cp /usr/ovra/keep.db "$nodeDb"
        info 0
    done
}

damagedCaches() {
    create 0
    info 0
    on 1 0 sh -c 'for f in /tmp/.ovradrcache/*; do head -c 200000 /dev/urandom >$f; done'
    info 0
    on 1 0 sh -c 'rm -r /tmp/.ovradrcache; ln -s /tmp /tmp/.ovradrcache'
    info 0
    logSays 1 "was not one that only user 0 may write"
}

killedDaemon() {
    create 0
    for _ in 1 2 3; do
        signalDaemon KILL || fail "no daemon to kill"
        startDaemon
        create 0
    done
    sleep 6
    info 0
    remain 1 4 0
}

speedOfAShapedLink() {
    [[ $("$lab" addr 2) != 127.* ]] || exit 77 # proot gives nodes no links of their own
    url=https://$("$lab" addr 2 1):5001
    create 0
    # Slow enough for a busy machine to keep up.
    "$lab" shape 1 --rate 20mbit --delay 20ms >/dev/null 2>&1 || "$lab" shape 1 --rate 20mbit >/dev/null
    # A busy machine slows some measurements down, but speeds none up.
    for _ in 1 2 3 4 5; do
        on 1 0 ovradr --json speed "$remote" --timeout 4
        holds '.data.bits_per_second < 22000000'
        (($(value '.data.bits_per_second | floor') <= 18000000)) || break
    done
    holds '.data.bits_per_second > 18000000'
    # The first two of node 1's four endpoints are unreachable now, the third is not.
    "$lab" drop 1 0 >/dev/null
    on 1 0 ovradr speed "$remote" --timeout 4 --retries 0
    says "https://$("$lab" addr 1 0):5001"
    says "http://$("$lab" addr 1 0):5000"
    says "downloads at"
    on 1 0 sh -c 'ls /usr/ovra/var/ovradr/speedtest | wc -l'
    [[ $output == 0 ]] || fail "a test file is left"
}

# exampleFails CODE ARGUMENT...: the example prints that code and what it is about.
exampleFails() {
    local code=$1
    shift
    on 1 1 "$example" "$@"
    output=${output#failed: }
    holds ".err_code == $code"
}
operationHereAndThere() {
    local there answers dead=https:127.0.0.1:1 example
    create 0 --json
    there=$(value .data.cred_id)
    cmake -S "$here/../../examples" -B "$work/examples" -DCMAKE_PREFIX_PATH="$OVRADR_LAB_PREFIX" >/dev/null
    cmake --build "$work/examples" --target reachable_from >/dev/null
    example=$work/examples/reachable_from answers=https:$("$lab" addr 2):5001
    for node in local "$remote"; do
        on 1 0 "$example" "$node" "$dead" "$answers"
        holds '[.. | .port? // empty] == [5001]'
        exampleFails 500 "$node" "$dead"
        exampleFails 401 "$node"
    done
    logSays 2 "No connection to [https://127.0.0.1:1]" # node 2 has tried it too
    on 1 0 env OVRADR_CRED="$there" "$example" "$remote" "$answers"
    OVRADR_CRED=none exampleFails 519 "$remote" "$answers"
    exampleFails 507 stranger "$answers"
    # Node 2 forwards a request to the node of its own credential.
    admin 1 back
    on 2 0 ovradr --json cred create "$(at 1)" --account back --password-file /usr/ovra/pw \
        --fingerprint "$(fingerprint 1)"
    on 1 0 ovradr call "$remote" OVRA.DR.Node.Credential relay --param "cred_id=$(value .data.cred_id)" \
        --param 'webapi={"api":"OVRA.DR.Node","method":"info","version":1,"params":{}}'
    holds '[.. | .hostname? // empty] == ["node-1"]'
    on 1 7 ovradr call "$remote" OVRA.DR.Node.Credential relay --param cred_id=none \
        --param 'webapi={"api":"OVRA.DR.Node","method":"info","version":1}'
}

# The credential that the last command created.
made() { value .data.cred_id; }
# Both nodes are asked for forty credentials in both directions at the same moment.
flowsAtOnce() {
    local node there
    local -A cred sid entry
    admin 1 replica
    for node in 1 2; do
        there=$((3 - node)) entry[$node]=$(at "$node")/webapi/query.cgi
        on "$node" 0 ovradr --json cred create "$(at $there)" --account replica \
            --password-file /usr/ovra/pw --fingerprint "$(fingerprint $there)"
        cred[$node]=$(made)
        on "$node" 0 curl -qsk "${entry[$node]}" \
            -d "api=OVRA.Core.Auth&version=1&method=login&account=\"replica\"&passwd=\"$password\""
        sid[$node]=$(value .data.sid)
    done
    for node in 1 2; do
        on "$node" 0 curl -qskZ --parallel-immediate --parallel-max 40 "${entry[$node]}?[1-40]" \
            -d "api=OVRA.DR.Node.Credential&version=1&method=create&_sid=${sid[$node]}" \
            -d "auth=\"cred_id\"&cred_id=\"${cred[$node]}\"&cred_direction=\"bidirection\"" &
    done
    wait
    remain 1 81 1
    remain 2 81 1
}

sharedSessions() {
    local which word left
    local -A cred
    admin 2 other
    create 0 --json && cred[a]=$(made)
    on 1 0 ovradr --json cred create --from-cred "${cred[a]}" && cred[b]=$(made)
    on 1 0 sh -c "sqlite3 $nodeDb 'SELECT session FROM node_cred LIMIT 1' |
        ovradr --json cred create $url --from-session -" && cred[c]=$(made)
    on 1 0 ovradr --json cred create --from-cred "${cred[a]}" --temp && cred[temp]=$(made)
    account=other create 0 --json && cred[other]=$(made)
    remain 1 5 0
    remain 2 0 3
    # The deleted credential, the outcome for its session, the number of sessions left.
    while read -r which word left; do
        on 1 0 ovradr --json cred delete "${cred[$which]}"
        holds ".data.session == \"$word\""
        remain 2 0 "$left"
    done <<-'END'
	a kept 3
	temp released 2
	b kept 2
	other released 1
	c released 0
	END
}

failuresSeenFromBothSides() {
    local cred
    admin 2 other
    admin 1 back
    on 2 0 ovradr user add plain --password-file /usr/ovra/pw
    create 0 --json && cred=$(made)
    on 1 0 ovradr cred reverse "$cred" --account back
    on 1 3 ovradr cred reverse "$cred" --account back --endpoint "https://$("$lab" addr 1):5999"
    on 1 7 ovradr cred reverse "$cred" --account nobody
    account=plain create 8
    says "does not permit"
    remain 1 1 1
    remain 2 1 1
    # The endpoint belongs to another node: this one.
    on 1 1 ovradr cred set "$cred" --url "$(at 1)" --account back \
        --password-file /usr/ovra/pw --fingerprint "$(fingerprint 1)"
    says "another node"
    # An update that cannot be written releases the new session, a creation leaves it.
    on 1 0 sqlite3 $nodeDb "CREATE TRIGGER up BEFORE UPDATE ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END;
        CREATE TRIGGER ins BEFORE INSERT ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END"
    on 1 9 ovradr cred set "$cred" --account other --password-file /usr/ovra/pw
    remain 2 1 1
    account=other create 9
    remain 1 1 1
    remain 2 1 2
    on 1 0 sqlite3 $nodeDb "DROP TRIGGER up; DROP TRIGGER ins"
    on 1 0 ovradr cred test "$cred"
    on 1 0 ovradr --json node id
    on 2 0 ovradr session audit "$(value .data.node_id)" --revoke --yes
    says "1 session here"
    remain 2 1 1
    # A session ended on the other node makes its credential an orphan.
    on 1 0 ovradr session revoke --all --yes
    on 1 0 ovradr session audit "$remote" --revoke --yes
    says "1 credential over there"
    remain 2 0 1
    info 0
    on 2 0 ovradr session revoke --account replica --yes
    on 1 4 ovradr cred test "$cred"
    on 1 0 ovradr --json cred delete "$cred"
    holds '.data.session == "ended_already"'
}

leftBehind() {
    local cred=""
    create 0 --json && cred=$(made)
    stopDaemon
    on 1 0 ovradr --json cred delete "$cred"
    holds '.data.session == "left_behind"'
    remain 1 0 0
    on 1 0 ovradr session pending
    says "does not answer"
    startDaemon
    remain 2 0 1
    # ovradrd checks every 20 seconds; only the pause after the first failure is shortened.
    on 1 0 sqlite3 /usr/ovra/var/ovradr/releases.db "UPDATE release SET next_try = 0"
    soon sh -c "ovradr --json session pending | jq -e '.data.pending == []'"
    remain 2 0 0
}

# Node 2 is the relay, and node 3 an appliance that accepts no inbound connections.
startRelay() {
    "$lab" run 2 -- sh -c "farlinkd --address $("$lab" addr 2) $* >/usr/ovra/relay.out 2>&1 &
        echo \$! >/usr/ovra/relay.pid"
    for _ in $(seq 50); do
        key=$("$lab" run 2 -- sed -n 's/.*key //p' /usr/ovra/relay.out)
        [[ -z $key ]] || return 0
        sleep 0.1
    done
    fail "farlinkd does not start"
}
killRelay() { on 2 0 sh -c 'kill -KILL "$(cat /usr/ovra/relay.pid)" && sleep 0.2'; }
callsThroughTheRelay() {
    local server begun thirdKey call
    server=https://$("$lab" addr 2)
    startRelay
    if [[ $server != */127.* ]]; then # proot has no firewall
        "$lab" hide 3 >/dev/null
        on 1 3 ovradr conn test "$(at 3)"
    fi
    on 3 0 sh -c "umask 077; printf %s '$password' >/usr/ovra/pw"
    admin 3 replica
    on 3 0 ovradr farlink enable --server "$server" --alias nas-3 --fingerprint "$key"
    on 1 8 ovradr farlink enable --server "$server" --alias nas-3 --fingerprint "$key"
    on 1 0 ovradr farlink enable --server "$server"
    on 3 0 ovradr conn local
    says "flk:nas-3"
    thirdKey=$(fingerprint 3)
    on 1 0 ovradr conn test flk:nas-3
    says "$thirdKey" # TLS ends at the appliance, not at the relay
    url=flk:nas-3 key=$thirdKey
    create 0 --json
    on 1 0 ovradr --json cred set "$(made)" --account replica --password-file /usr/ovra/pw
    holds '.data | (.endpoint | startswith("flk:")) and .endpoint_changed == false'
    on 3 0 ovradr --json node id
    remote=$(value .data.node_id)
    info 0
    holds '.hostname == "node-3"'

    # A request that takes 20 seconds: it measures a silent server.
    "$lab" run 1 -- perl -MIO::Socket::INET -e '
        my $door = IO::Socket::INET->new(Listen => 9, LocalAddr => $ARGV[0], LocalPort => 5998) or die;
        print "ready\n"; STDOUT->flush; my @kept; while (my $one = $door->accept) { push @kept, $one }' "$("$lab" addr 1)" </dev/null >"$work/silent" &
    disown
    until grep -qs ready "$work/silent"; do sleep 0.1; done
    begun=$SECONDS
    "$lab" run 1 -- ovradr call "$remote" OVRA.DR.Node test_download_speed --param retries=0 \
        --param timeout=20 --param "url=http://$("$lab" addr 1):5998/x" >"$work/call" 2>&1 </dev/null &
    call=$!
    sleep 2
    kill -0 $call || fail "the request ends before the relay does: $(cat "$work/call")"
    killRelay
    ! wait $call || fail "a request succeeds without the relay"
    ((SECONDS - begun < 10)) || fail "a request waits for a relay that is dead"
    on 1 3 ovradr call "$remote" OVRA.DR.Node info
    startRelay
    soon ovradr call "$remote" OVRA.DR.Node info

    # An alias whose owner does not return becomes free again.
    killRelay
    startRelay --lease 4
    soon ovradr conn test flk:nas-3
    on 3 0 ovradr farlink disable
    sleep 6
    on 1 0 ovradr farlink enable --server "$server" --alias nas-3
}

# shellcheck disable=SC2034 # read by up
[[ $1 != callsThroughTheRelay ]] || nodes=3
up
"$1"
echo "scene $1 as it should be"
