#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# proot-sandbox.sh PATH... -- COMMAND...: lab/sandbox where namespaces are not permitted. The PATHs
# are visible unchanged in the view.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/common.sh
. "$lib/common.sh"
# shellcheck source=lab/lib/processes.sh
. "$lib/processes.sh"
# shellcheck source=lab/lib/view.sh
. "$lib/view.sh"
# shellcheck source=lab/lib/proot.sh
. "$lib/proot.sh"

keep=()
while [[ $1 != -- ]]; do
    keep+=("$1")
    shift
done
shift

id=$(newId)
# Short and fixed: proot prepends this folder to the path of every Unix socket, which is limited to
# 107 bytes.
folder=$(mktemp -d /tmp/ovl.XXXXXX)
# With the mode of a machine's root folder, for commands that change their user.
chmod 711 "$folder"

# shellcheck disable=SC2317 # called by the trap
cleanUp() {
    trap '' INT TERM HUP
    killLab "$id" || echo "sandbox: processes of this sandbox survive SIGKILL" >&2
    removeTree "$folder"
}
trap cleanUp EXIT
trap 'exit 130' INT
trap 'exit 143' TERM
trap 'exit 129' HUP

# The guard survives a SIGKILL of this script: it waits for the end of a pipe that only this script
# holds, and then cleans up. It is detached in its own session, so that killing a whole process tree
# does not kill it too.
exec {hold}> >(exec setsid -f bash "$labLib/guard.sh" "$folder" "$id" >/dev/null 2>&1)

mkdir "$folder/root"
prootView "$folder/root" "${keep[@]}"
export OVRADR_LAB_ID=$id
code=0
prootRun "$folder" "$@" {hold}>&- || code=$?
unset OVRADR_LAB_ID
exit "$code"
