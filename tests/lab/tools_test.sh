#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# tools_test.sh SCENE: the repository's own checks find the faults that they look for.
set -euo pipefail
# shellcheck source=tests/lab/expect.sh
. "$(dirname "$0")/expect.sh"
trap 'rm -rf "$scratch"' EXIT

layersRefuseWhatIsAbovePrivateOrASibling() {
    mkdir -p "$scratch"/{base/src,core/src,src/{model,transport,cache,cred},platform/linux/{trust,include/ovraplatform},apps/{one,two,service,shared}}
    put() { printf '#include %s\n' "$2" >"$scratch/$1"; }
    put src/transport/sender.cpp '"ovradrnode/node_cache.h"'
    put src/transport/conn_cache.h '<ovradrcore/cache.h>'
    put src/cache/node_cache.cpp '"ovradrnode/sender.h"'
    put src/words.h '<string>'
    put core/src/cache_file.h '<ovrabase/file.h>'
    put platform/linux/trust/verifier.h '<ovradrcore/log.h>'
    put platform/linux/trust/verifier.cpp '"ovraplatform/trust.h"'
    put apps/one/main.cpp '<ovradrnode/ovradrnode.h>'
    put apps/one/only_one.h '"service/http_server.h"'
    put apps/service/http_server.h '<ovraplatform/trust.h>'
    put apps/shared/session.h '<ovradrnode/sender.h>'
    ends "front doors and ways down" 0 "" "$root/tools/check-layers" "$scratch"

    local file include reason
    while read -r file include reason; do
        put "$file" "$include"
        ends "$file includes $include" 1 "$file:1:" "$root/tools/check-layers" "$scratch"
        holds "$file includes $include" "$output" "$reason"
        rm "$scratch/$file"
    done <<-'END'
	base/src/x.cpp <ovradrcore/log.h> not below
	core/src/x.cpp "ovradrnode/conn.h" not below
	src/model/x.cpp "ovradrnode/node_db.h" not below
	src/model/y.cpp <ovraplatform/trust.h> not below
	src/transport/x.cpp <ovradrnode/operation_dispatcher.h> not below
	platform/linux/trust/x.cpp "ovradrnode/conn.h" not below
	apps/service/x.cpp <ovradrnode/sender.h> not below
	apps/one/x.cpp "words.h" private to src
	apps/one/y.cpp "trust/verifier.h" private to platform/linux
	src/cred/x.cpp "transport/conn_cache.h" private to src/transport
	platform/linux/trust/y.cpp "cache_file.h" private to core
	apps/two/x.cpp "only_one.h" sibling
	apps/two/y.cpp "one/only_one.h" sibling
	apps/shared/x.cpp "service/http_server.h" sibling
	END
}

# A minimal checkout: three libraries, each with a header of one class and one function.
makeLibraries() {
    local part name space folder
    mkdir -p "$scratch/tools"
    cp "$root/tools/check-exports" "$root/tools/declared-symbols" "$scratch/tools/"
    for part in core:OvraDRCore:core/include node:OvraDRNode:include platform:OVRA:platform/include; do
        IFS=: read -r name space folder <<<"$part"
        mkdir -p "$scratch/$folder"
        printf '#include <vector>\nnamespace %s { struct A { virtual ~A(); }; int f(std::vector<A>); }\n' \
            "$space" >"$scratch/$folder/$name.h"
        printf '#include "%s"\nnamespace %s { A::~A() {} int f(std::vector<A>) { return 1; } }\n%s\n' \
            "$scratch/$folder/$name.h" "$space" \
            '__attribute__((visibility("hidden"))) int inner() { return 2; }' >"$scratch/$name.cpp"
        buildLibrary "$name"
    done
}

buildLibrary() {
    g++ -shared -fPIC -fvisibility-inlines-hidden -o "$scratch/libovradr$1.so" "$scratch/$1.cpp"
}

exportsAreTheDeclaredNamesNoMoreAndNoLess() {
    makeLibraries
    ends "only names of their own" 0 "" "$scratch/tools/check-exports" "$scratch"
    echo 'int helper() { return 3; }' >>"$scratch/core.cpp"
    buildLibrary core
    ends "a helper that got out" 1 helper "$scratch/tools/check-exports" "$scratch"
    echo 'namespace OvraDRNode { struct __attribute__((visibility("hidden"))) B { virtual ~B(); }; }' >>"$scratch/include/node.h"
    echo 'OvraDRNode::B::~B() {}' >>"$scratch/node.cpp"
    buildLibrary node
    echo 'extern int OVRACount; namespace OVRA { inline int g() { return 1; } int h(); }' >>"$scratch/platform/include/platform.h"
    ends "a class that is hidden" 1 'vtable for OvraDRNode::B' "$scratch/tools/check-exports" "$scratch"
    holds "a function that nobody defines" "$output" 'OVRA::h()'
    holds "a variable that nobody defines" "$output" OVRACount
    [[ $output != *'g()'* ]] || broken "a function that needs no library: $output"
}

scenesNameTheLineThatFailed() {
    local library head
    while read -r library head; do
        # It fails in line 3, which line 4 calls.
        printf '%s\n' "set -euo pipefail; . '$root/$library'" 'helper() {' '"$@"; }' 'scene() { helper "$@"; }' 'scene "$@"' >"$scratch/scene.sh"
        ends "$head" 1 "scene.sh:3: FAILED: this is wrong" bash "$scratch/scene.sh" "$head" "this is wrong"
        holds "who asked for it" "$output" "scene.sh:4: called from here"
        ends "a command that failed" 1 "scene.sh:3: FAILED: exit code 1 of: " bash "$scratch/scene.sh" grep -q this /dev/null
    done <<-'END'
	tests/lab/expect.sh broken
	lab/lib/play.sh fail
	END
}

checkFacts() { missed "$1" "$2" "$3" "$root/tools/check-facts" "$scratch"; }

# Removes one fact after another from a copy of the checkout.
factsAreMissedWhereTheyAreForgotten() {
    "$root/tools/sources" all | tar -C "$root" --null -T - -c | tar -C "$scratch" -x
    ends "the checkout as it is" 0 "" "$root/tools/check-facts" "$scratch"

    local errors=core/include/ovradrcore/err_recorder.h
    checkFacts 'failure.cpp: no ErrorEntry for code 599' "$errors" 's/kFailed = 407/kNew = 599, &/'
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
    checkFacts 'no row for getDRNodeInfoAPI' tests/api/node_api_test.cpp '/BUILT_BY(getDRNodeInfoAPI,/d'
    checkFacts 'no row for `OVRA.DR.Node` 1 `stat`' tests/api/node_api_test.cpp 's/Node test_privilege 1/Node stat 1/'
    checkFacts 'docs/wire.md: no row for the method release' docs/wire.md '/^| `release`/d'
    checkFacts 'names `ovradr set up`' apps/ovradrd/main.cpp 's/`ovradr setup`/`ovradr set up`/'
    checkFacts 'does not name conn_test.cpp' tests/model/CMakeLists.txt 's/ conn_test.cpp//'
    checkFacts 'no include of node_db.h' include/ovradrnode/ovradrnode.h '/node_db.h/d'
    checkFacts 'links to file.md' docs/architecture.md 's/(files.md)/(file.md)/'
    checkFacts 'names src/creds, which is not there' docs/architecture.md 's:`src/cred`:`src/creds`:'
    checkFacts 'no such heading' docs/farlinkd.md 's/wire.md#the-relay/wire.md#relays/'
}

"$1"
