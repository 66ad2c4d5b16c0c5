#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Usage: install_test.sh BUILD_DIR SOURCE_DIR
# Installs into an empty prefix, moves it, and lets an external project find, build and run against
# it.
set -euo pipefail
build=$1
source=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

cmake --install "$build" --prefix "$work/first" >"$work/install.log"
mv "$work/first" "$work/moved"

cmake -S "$source/examples" -B "$work/cmake" -G Ninja -DCMAKE_PREFIX_PATH="$work/moved" >"$work/log"
cmake --build "$work/cmake"
pc=$(dirname "$(find "$work/moved" -name ovradrnode.pc)")
read -ra flags < <(PKG_CONFIG_PATH=$pc pkg-config --cflags --libs ovradrnode)
# The unchanged program from the README.
sed -n '/^```cpp$/,/^```$/{/^```/!p}' "$source/README.md" >"$work/readme.cpp"
g++ -std=c++17 "$work/readme.cpp" "${flags[@]}" -o "$work/by_pkg_config"

# An unknown node is a clear error, not a crash.
library=$(dirname "$(find "$work/moved" -name libovradrnode.so.1)")
for program in "$work/cmake/node_info" "$work/by_pkg_config"; do
    if LD_LIBRARY_PATH=$library${LD_LIBRARY_PATH:+:$LD_LIBRARY_PATH} "$source/lab/sandbox" "$program" no-such-node 2>"$work/err"; then
        echo "expected a failure of $program"
        exit 1
    fi
    grep -q '"err_code":401' "$work/err" || { cat "$work/err"; exit 1; }
done
echo "installed, moved, found by CMake and by pkg-config"
