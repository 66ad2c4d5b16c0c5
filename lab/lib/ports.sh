# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Labs made by proot share this machine's ports, so that scenes and tests play one after the other.

# takePorts WAY: waits for its turn, at most two minutes, where WAY is proot. The turn ends with the
# last process that inherited it, so also when this one is killed.
takePorts() {
    local turn
    [[ $1 == proot ]] || return 0
    exec {turn}>>"/tmp/ovra-proot-ports.$UID"
    flock -w 120 "$turn" || {
        echo "another lab made by proot has held the ports for two minutes; end it with: lab down" >&2
        exit 1
    }
}
