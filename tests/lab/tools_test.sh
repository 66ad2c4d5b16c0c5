#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# tools_test.sh SCENE: the repository's own checks find what they are there for.
set -euo pipefail
# shellcheck source=tests/lab/expect.sh
. "$(dirname "$0")/expect.sh"
trap 'rm -rf "$scratch"' EXIT

layersRefuseAnUpwardInclude() {
    mkdir -p "$scratch"/{core/src,src/{model,transport,cache},platform/linux/net,apps/x}
    put() { printf '#include %s\n' "$2" >"$scratch/$1"; }
    put src/transport/sender.cpp '"ovradrnode/node_cache.h"'
    put src/cache/node_cache.cpp '"ovradrnode/sender.h"'
    put platform/linux/net/link_addresses.h '<ovradrcore/log.h>'
    put src/words.h '<string>'
    put apps/x/main.cpp '<ovradrnode/ovradrnode.h>'
    exitCodeOf "$root/tools/check-layers" "$scratch"
    same "two layers that belong together" "$code" 0

    local file include
    while read -r file include; do
        put "$file" "$include"
        exitCodeOf "$root/tools/check-layers" "$scratch"
        same "$file includes $include" "$code" 1
        holds "$file includes $include" "$output" "$file:1:"
        rm "$scratch/$file"
    done <<-'END'
	core/src/cache.cpp "ovradrnode/conn.h"
	src/model/conn.cpp "ovradrnode/node_db.h"
	src/model/dr_node.cpp "net/link_addresses.h"
	src/transport/x.cpp <ovradrnode/operation_dispatcher.h>
	platform/linux/net/x.cpp "ovradrnode/conn.h"
	apps/x/x.cpp "words.h"
	END
}

exportsRefuseAForeignName() {
    local name space
    for name in core:OvraDRCore node:OvraDRNode platform:OVRA; do
        space=${name#*:}
        printf '#include <vector>\nnamespace %s { struct A { virtual ~A(); }; A::~A() {} int f(std::vector<A>) { return 1; } }\n%s\n' \
            "$space" '__attribute__((visibility("hidden"))) int inner() { return 2; }' >"$scratch/${name%:*}.cpp"
        g++ -shared -fPIC -fvisibility-inlines-hidden -o "$scratch/libovradr${name%:*}.so" "$scratch/${name%:*}.cpp"
    done
    exitCodeOf "$root/tools/check-exports" "$scratch"
    same "only names of their own: $output" "$code" 0
    echo 'int helper() { return 3; }' >>"$scratch/core.cpp"
    g++ -shared -fPIC -fvisibility-inlines-hidden -o "$scratch/libovradrcore.so" "$scratch/core.cpp"
    exitCodeOf "$root/tools/check-exports" "$scratch"
    same "a helper that got out" "$code" 1
    holds "a helper that got out" "$output" helper
}

# checkFacts TEXT FILE SED: with the change, check-facts fails and says TEXT.
checkFacts() {
    local text=$1 file=$scratch/$2 change=$3
    cp "$file" "$scratch/before"
    sed -i "$change" "$file"
    ! cmp -s "$file" "$scratch/before" || broken "$change changes nothing in $2"
    exitCodeOf "$root/tools/check-facts" "$scratch"
    same "$change in $2" "$code" 1
    holds "$change in $2" "$output" "$text"
    cp "$scratch/before" "$file"
}

# One fact after the other is taken out of a copy of the checkout.
factsAreMissedWhereTheyAreForgotten() {
    "$root/tools/sources" all | tar -C "$root" --null -T - -c | tar -C "$scratch" -x
    exitCodeOf "$root/tools/check-facts" "$scratch"
    same "the checkout as it is: $output" "$code" 0

    local errors=core/include/ovradrcore/err_recorder.h
    checkFacts 'failure.cpp: no Meaning for code 599' "$errors" 's/kFailed = 407/kNew = 599, &/'
    checkFacts 'docs/ovradr.md: no row for code 599' "$errors" 's/kFailed = 407/kNew = 599, &/'
    checkFacts 'no text for kFailed' core/src/err_recorder.cpp '/case kFailed:/d'
    checkFacts 'docs/ovradr.md: no row for code 505' docs/ovradr.md '/^| 505 /d'
    checkFacts 'docs/wire.md: row for code 110 is not' docs/wire.md 's/^| 109 |/| 110 |/'
    checkFacts 'docs/ovradr.md: no row for exit code 13' docs/ovradr.md '/^| 13 /d'
    checkFacts 'docs/ovradr.md: no exit code 13 clock' docs/ovradr.md 's/`clock` | Of/`time` | Of/'
    checkFacts 'docs/farlinkd.md: no row for exit code 3' docs/farlinkd.md '/^| 3 /d'
    checkFacts 'docs/ovradrd.md: row for exit code 4 is not' docs/ovradrd.md 's/^| 3 | a port/| 4 |/'
    checkFacts 'docs/files.md: no key of ovradrd.conf: serial' docs/files.md 's/, `serial`//'
    checkFacts 'docs/files.md: no row for /usr/ovra/var/ovradr/sessions.db' docs/files.md '/sessions.db/d'
    checkFacts 'docs/files.md: no row for /run/lock/drnode.info.lock' docs/files.md '/drnode.info.lock` |/d'
    checkFacts '/usr/ovra/var/ovradr/tokens.db is not in the code' docs/files.md 's/releases.db` |/tokens.db` |/'
    checkFacts 'stands in apps/ovradrd/main.cpp too' apps/ovradrd/main.cpp \
        '$a const char kAgain[] = "/usr/ovra/var/ovradr/releases.db";'
    checkFacts 'docs/files.md: no word on the cache file dr_node_conn_cache' docs/files.md 's/`dr_node_conn_cache`//'
    checkFacts 'docs/ovradrd.md: no fact about a node: timezone' docs/ovradrd.md 's/known: `timezone`/known: zone/'
    checkFacts 'no request for the fact hostname' src/cache/node_cache.cpp 's/API({Word::kTimeZone/API({Word::kHostName, Word::kTimeZone/'
    checkFacts 'no row for getDRNodeInfoAPI' tests/api/node_api_test.cpp '/{getDRNodeInfoAPI(/d'
    checkFacts 'no row for `OVRA.DR.Node` 1 `stat`' tests/api/node_api_test.cpp 's/"test_privilege", 1/"stat", 1/'
    checkFacts 'docs/wire.md: no row for the method release' docs/wire.md '/^| `release`/d'
    checkFacts 'names `ovradr set up`' apps/ovradrd/main.cpp 's/`ovradr setup`/`ovradr set up`/'
    checkFacts 'does not name conn_test.cpp' tests/model/CMakeLists.txt 's/ conn_test.cpp//'
    checkFacts 'no include of node_db.h' include/ovradrnode/ovradrnode.h '/node_db.h/d'
    checkFacts 'links to file.md' docs/architecture.md 's/(files.md)/(file.md)/'
    checkFacts 'names src/creds, which is not there' docs/architecture.md 's:`src/cred`:`src/creds`:'
    checkFacts 'no such heading' docs/farlinkd.md 's/wire.md#the-relay/wire.md#relays/'
}

"$1"
