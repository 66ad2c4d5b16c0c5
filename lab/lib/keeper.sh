#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# keeper.sh FOLDER: supervises one lab. Starts it, waits for its end, and then removes its processes
# and its folder. `lab up` writes "keep" to the standard input once the lab is up; if the input ends
# without it (`lab up` failed, was interrupted, was killed), the lab ends. `lab down` ends it with
# SIGTERM.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/common.sh
. "$lib/common.sh"
# shellcheck source=lab/lib/processes.sh
. "$lib/processes.sh"
# shellcheck source=lab/lib/way.sh
. "$lib/way.sh"
# shellcheck source=lab/lib/view.sh
. "$lib/view.sh"
# shellcheck source=lab/lib/proot.sh
. "$lib/proot.sh"
# shellcheck source=lab/lib/state.sh
. "$lib/state.sh"

lab=$1
labWay=$(<"$lab/way") labPrefix=$(<"$lab/prefix") labCount=$(<"$lab/count") labId=$(<"$lab/id")

cleanUp() {
    trap '' INT TERM HUP
    stopNodes "$lab" "$labCount"
    killLab "$labId" || echo "processes of this lab survive SIGKILL" >&2
    removeTree "$lab"
}
trap cleanUp EXIT
trap exit INT TERM HUP

startNamespaces() {
    local users=()
    [[ $labWay == root ]] || users=("${userNamespace[@]}")
    exec {info}>"$lab/init.json"
    bwrap --bind / / --dev-bind /dev /dev --unshare-pid --proc /proc --unshare-net --unshare-uts \
        --hostname lab --die-with-parent "${users[@]}" --info-fd "$info" -- \
        /bin/bash "$labLib/init.sh" "$lab" 9<&- </dev/null &
    exec {info}>&-
}

startProots() {
    local i
    for ((i = 1; i <= labCount; i++)); do
        mkdir "$lab/n$i/root"
        prootView "$lab/n$i/root" "$labRoot" "$labPrefix" "$lab"
        printf '%s\0' "${viewArgs[@]}" >"$lab/n$i/proot.args"
        asProot "$lab/n$i" /bin/bash "$labLib/node.sh" "$lab" "$i" 9<&- </dev/null &
    done
}

PATH=$(insidePath "$labPrefix")
# The id is exported only now, so that this process itself is not found by it.
export PATH OVRADR_LAB_WAY=$labWay OVRADR_LAB_ID=$labId
if [[ $labWay == proot ]]; then startProots; else startNamespaces; fi
echo "$$" >"$lab/keeper.pid"

word=
IFS= read -r word || true
[[ $word == keep ]] || exit 0
# A node may end before the others; the lab ends when all have.
wait
