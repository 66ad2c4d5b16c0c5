#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# stage.sh CMAKE BUILD_DIR STAGE: builds what the scenes use, if necessary, and installs it into STAGE.
# Unchanged files stay untouched: another run of the tests may be using them.
set -euo pipefail
cmake=$1 build=$2 stage=$3
"$cmake" --build "$build" --target ovradrcore ovradrnode ovradrplatform ovradr ovradrd farlinkd
"$cmake" --install "$build" --prefix "$stage" >"$stage.log" || { cat "$stage.log"; exit 1; }
