#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# guard.sh FOLDER ID: at the end of standard input, kills every process with that id and removes
# FOLDER.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/processes.sh
. "$lib/processes.sh"

trap '' INT TERM HUP
cat >/dev/null || true
killLab "$2" || true
removeTree "$1"
