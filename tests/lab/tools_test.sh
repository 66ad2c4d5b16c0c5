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

# A checkout of its own: three libraries, each with a header of one class and one function.
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

exportsRefuseAForeignName() {
    makeLibraries
    exitCodeOf "$scratch/tools/check-exports" "$scratch"
    same "only names of their own: $output" "$code" 0
    echo 'int helper() { return 3; }' >>"$scratch/core.cpp"
    buildLibrary core
    exitCodeOf "$scratch/tools/check-exports" "$scratch"
    same "a helper that got out" "$code" 1
    holds "a helper that got out" "$output" helper
}

exportsMissNothingThatIsDeclared() {
    makeLibraries
    echo 'namespace OvraDRNode { struct __attribute__((visibility("hidden"))) B { virtual ~B(); }; }' >>"$scratch/include/node.h"
    echo 'OvraDRNode::B::~B() {}' >>"$scratch/node.cpp"
    buildLibrary node
    echo 'extern int OVRACount; namespace OVRA { inline int g() { return 1; } int h(); }' >>"$scratch/platform/include/platform.h"
    exitCodeOf "$scratch/tools/check-exports" "$scratch"
    same "hidden and undefined names" "$code" 1
    holds "a class that is hidden" "$output" 'vtable for OvraDRNode::B'
    holds "a function that nobody defines" "$output" 'OVRA::h()'
    holds "a variable that nobody defines" "$output" OVRACount
    [[ $output != *'g()'* ]] || broken "a function that needs no library: $output"
}

"$1"
