#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# stage.sh CMAKE BUILD_DIR STAGE: builds what the scenes play, where it is not built yet, and installs it
# into STAGE. What has not changed stays as it is: another run of the tests may be playing with it.
set -euo pipefail
cmake=$1 build=$2 stage=$3
"$cmake" --build "$build" --target ovradrcore ovradrnode ovradrplatform ovradr ovradrd farlinkd
"$cmake" --install "$build" --prefix "$stage" >"$stage.log" || { cat "$stage.log"; exit 1; }
