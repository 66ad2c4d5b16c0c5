# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Locates the failing line of a scene.

traceRoot=$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd -P)
traceScript=$(readlink -f "$0")

# trace WHAT: the call stack in the started script, innermost first and with WHAT, as FILE:LINE
# relative to the checkout. Sourced helpers are left out.
trace() {
    local i what=$1
    for ((i = 1; i < ${#BASH_SOURCE[@]}; i++)); do
        [[ ${BASH_SOURCE[i]} == "$0" && (${FUNCNAME[i]} != main || $what == "$1") ]] || continue
        printf '%s:%d: %s\n' "${traceScript#"$traceRoot"/}" "${BASH_LINENO[i - 1]}" "$what"
        what="called from here"
    done
}
