# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Shared by every script of the lab: paths, error messages, addresses.

# The physical path of the checkout, which is the same in every file view.
labRoot=$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd -P)
# shellcheck disable=SC2034 # read by the sourcing script
labLib=$labRoot/lab/lib

# fail MESSAGE...: prints one line on standard error, what was wrong and what to do, and exits.
fail() {
    printf 'lab: %s\n' "$*" >&2
    exit 1
}

# needProgram PROGRAM PACKAGE: fails with the Debian package to install if PROGRAM is missing.
needProgram() {
    command -v "$1" >/dev/null || fail "$1 is missing; install the Debian package $2 (scripts/install-deps lab does it)"
}

# newId: 64 random bits as 16 hexadecimal digits. Every process of a lab has its id in the
# environment, so that all of them, and no others, are found when the lab is taken down.
newId() { od -An -N8 -tx8 /dev/urandom | tr -d ' '; }

# insidePath PREFIX: the PATH of a command inside a node; an ordinary user's lacks ip and nft.
insidePath() { printf '%s/bin:%s/sbin:%s:/usr/sbin:/sbin' "$1" "$1" "$PATH"; }

# nodeAddress WAY NODE LINK: the address of a node. With proot all nodes share the loopback
# interface and have one address each.
nodeAddress() {
    if [[ $1 == proot ]]; then
        printf '127.0.1.%d' "$2"
    else
        printf '10.77.%d.%d' "$3" "$2"
    fi
}

# nodeAddresses WAY NODE: all of them, separated by commas.
nodeAddresses() {
    if [[ $1 == proot ]]; then
        nodeAddress proot "$2" 0
    else
        printf '%s,%s' "$(nodeAddress "$1" "$2" 0)" "$(nodeAddress "$1" "$2" 1)"
    fi
}
