# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Proot labs share this machine's ports, so scenes and tests run one after another.

# takePorts WAY: if WAY is proot, waits for the lock on the ports, at most two minutes. The lock is
# released with the last process that inherited it, so also when this one is killed.
takePorts() {
    local turn
    [[ $1 == proot ]] || return 0
    exec {turn}>>"/tmp/ovra-proot-ports.$UID"
    flock -w 120 "$turn" || {
        echo "another lab made by proot has held the ports for two minutes; end it with: lab down" >&2
        exit 1
    }
}
