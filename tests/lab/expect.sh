# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# shellcheck disable=SC2034 # set for the scenes
# Shared by the scenes of this folder: a scratch folder and a few assertions.
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd -P)
# Under /tmp, and short, regardless of TMPDIR: proot needs short paths.
scratch=$(mktemp -d /tmp/ovt.XXXX)

# shellcheck source=lab/lib/trace.sh
. "$root/lab/lib/trace.sh"

# broken WHAT: ends the scene.
broken() {
    trace "FAILED: $*" >&2
    exit 1
}
# A command failed unexpectedly. In a subshell the enclosing command decides.
set -E
trap '((BASH_SUBSHELL)) || broken "exit code $? of: $BASH_COMMAND"' ERR

same() { [[ $2 == "$3" ]] || broken "$1: expected \"$3\", got \"$2\""; }
holds() { [[ $2 == *"$3"* ]] || broken "$1: expected \"$3\" somewhere in: $2"; }

# exitCodeOf COMMAND...: sets code and output (both streams).
exitCodeOf() { output=$("$@" 2>&1 </dev/null) && code=0 || code=$?; }

# ends WHAT CODE TEXT COMMAND...: COMMAND ends with that exit code and prints TEXT.
ends() {
    exitCodeOf "${@:4}"
    same "exit code of $1: $output" "$code" "$2"
    holds "$1" "$output" "$3"
}

# missed TEXT FILE SED COMMAND...: with this change of a file below $scratch COMMAND fails and prints TEXT.
missed() {
    local text=$1 file=$scratch/$2 change=$3
    shift 3
    cp "$file" "$scratch/before"
    sed -i "$change" "$file"
    ! cmp -s "$file" "$scratch/before" || broken "$change changes nothing in $file"
    ends "$change in $file" 1 "$text" "$@"
    cp "$scratch/before" "$file"
}

# eventually WHAT COMMAND...: COMMAND succeeds within 10 seconds.
eventually() {
    local what=$1 i
    shift
    for ((i = 0; i < 200; i++)); do
        ! "$@" || return 0
        sleep 0.05
    done
    broken "$what"
}
