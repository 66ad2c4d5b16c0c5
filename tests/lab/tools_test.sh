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

scenesNameTheLineThatFailed() {
    local library head
    while read -r library head; do
        # It fails in line 3, which line 4 calls.
        printf '%s\n' "set -euo pipefail; . '$root/$library'" 'helper() {' '"$@"; }' 'scene() { helper "$@"; }' 'scene "$@"' >"$scratch/scene.sh"
        exitCodeOf bash "$scratch/scene.sh" "$head" "this is wrong"
        same "exit code of $head" "$code" 1
        holds "an expectation" "$output" "scene.sh:3: FAILED: this is wrong"
        holds "who asked for it" "$output" "scene.sh:4: called from here"
        exitCodeOf bash "$scratch/scene.sh" grep -q this /dev/null
        same "exit code of a command" "$code" 1
        holds "a command that failed" "$output" "scene.sh:3: FAILED: exit code 1 of: "
    done <<-'END'
	tests/lab/expect.sh broken
	lab/lib/play.sh fail
	END
}

"$1"
