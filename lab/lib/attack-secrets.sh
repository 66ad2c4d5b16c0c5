# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# shellcheck disable=SC2154 # of lab/lib/play.sh
# The scene attack-secrets: every flow with marked secrets, and then a search for them.

# Where docs/files.md says that a secret is stored.
allowed='((session|reverse) /usr/ovra/(etc/ovradr/node|var/ovradr/(sessions|releases))|totp /usr/ovra/var/ovradr/accounts)\.db$'
etc=/usr/ovra/etc/ovradr var=/usr/ovra/var/ovradr

# daemon CODE METHOD PARAMS: a call of the credential API, which the daemon of node 1 carries out.
daemonCall() {
    "$lab" run 1 -- sh -c 'umask 077; cat >/usr/ovra/params' <<<"$3"
    on 1 "$1" ovradr --json call local OVRA.DR.Node.Credential "$2" --params-file /usr/ovra/params
    "$lab" run 1 -- rm /usr/ovra/params
}
conn() { printf '"addr": "%s", "protocol": "%s", "port": %s' "$("$lab" addr 2)" "$1" "$2"; }
account() { printf '"account": "replica", "password": "%s", "otpcode": "%s"' "$1" "$2"; }
proof() { printf '{"auth": "account", "conn": {%s}, %s' "$(conn "$1" "$2")" "$(account "$3" "$4")"; }
# The next one-time code; each is accepted once, so this waits for the next step of 30 seconds.
nextCode() {
    local before=${code-}
    while code=$(oathtool --totp --base32 "$totp") && [[ $code == "$before" ]]; do sleep 1; done
    codes+=("$code")
}
# stored NODE DATABASE QUERY: keeps the secrets of a column as canaries.
stored() {
    local text
    text=$("$lab" run "$1" -- sqlite3 "$2" "$3")
    [[ -n $text ]] || fail "nothing is stored where a secret should be: $2"
    while IFS= read -r each; do canaries+="$4 $each"$'\n'; done <<<"$text"
}
# search WHEN: no secret is on either node but where it is allowed.
search() {
    local node found each canaries=$canaries number=0
    for each in "${codes[@]}"; do canaries+="code$((number++)) $each"$'\n'; done
    for node in 1 2; do
        found=$("$lab" run "$node" -- perl "$here/lib/search.pl" "$etc" "$var" /usr/ovra/var/farlinkd \
            /tmp/.ovradrcache /run/lock <<<"${canaries%$'\n'}") || fail "the search does not work: $found"
        found+=$'\n'$("$lab" log "$node" | grep -oFf <(cut -d' ' -f2 <<<"${canaries%$'\n'}") |
            sed 's/^/log /' || true)
        found=$(grep -vE "^\$|$allowed" <<<"$found" | sort | uniq -c) || true
        [[ -z $found ]] || { left=yes && printf '  %s, node %s:\n%s\n' "$1" "$node" "$found"; }
    done
    line "searched" "$1"
}

playAttack-secrets() {
    [[ $(<"$OVRADR_LAB_DIR/way") != proot ]] || {
        echo "skipped: memory that is traced by proot cannot be searched"
        exit 77
    }
    local totp code="" codes=() canaries="" left="" id
    canaries="password $password"$'\n'"wrong-password canary-wrong-password"$'\n'
    on 2 0 ovradr --json user totp replica --show
    totp=$(value .data.secret)
    canaries+="totp $totp"$'\n'
    on 1 0 ovradr user add admin --admin --password-file /usr/ovra/pw
    for node in 1 2; do on "$node" 0 rm /usr/ovra/pw; done
    nextCode
    daemonCall 4 create "$(proof https 5001 canary-wrong-password "$code"), \"cred_direction\": \"unidirection\"}"
    search "a wrong log-in"
    nextCode
    daemonCall 0 test_create "$(proof https 5001 "$password" "$code")}"
    search "a log-in"
    nextCode
    daemonCall 0 create "$(proof https 5001 "$password" "$code"), \"cred_direction\": \"bidirection\",
        \"local_account\": \"admin\"}"
    id=$(value .data.src_cred.cred_id)
    stored 1 "$etc/node.db" "select session from node_cred where session <> ''" session
    stored 2 "$etc/node.db" "select session from node_cred where session <> ''" reverse
    search "a pair in both directions"
    nextCode
    daemonCall 0 set "{\"cred_id\": \"$id\", $(conn http 5000), $(account "$password" "$code")}"
    stored 1 "$etc/node.db" "select session from node_cred where session <> ''" session
    search "an update over plain HTTP"
    daemonCall 0 reverse_create "{\"cred_id\": \"$id\", \"local_account\": \"admin\"}"
    daemonCall 0 relay "{\"cred_id\": \"$id\",
        \"webapi\": {\"api\": \"OVRA.DR.Node\", \"version\": 1, \"method\": \"info\"}}"
    stored 2 "$var/sessions.db" "select id from session" session
    stored 1 "$var/sessions.db" "select id from session" reverse
    search "a call and a way back"
    daemonCall 0 delete "{\"cred_id\": \"$id\"}"
    search "a deletion"
    [[ -z $left ]] || fail "secrets are left"
}
