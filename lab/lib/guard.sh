#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# guard.sh FOLDER ID: when standard input ends, kills every process with that id, removes FOLDER.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/processes.sh
. "$lib/processes.sh"

trap '' INT TERM HUP
cat >/dev/null || true
killLab "$2" || true
removeTree "$1"
