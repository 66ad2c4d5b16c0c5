# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Picks one of the three ways that this machine allows. Sets labWay (root, user or proot) and
# labWhy.

# Joins a user namespace as its root with every capability in it, so that links and firewall rules
# can be created there as by root.
userNamespace=(--unshare-user --uid 0 --gid 0 --cap-add ALL)

# wayTry WAY COMMAND...: whether COMMAND succeeds inside fresh namespaces of that way.
wayTry() {
    local flags=()
    [[ $1 == root ]] || flags=("${userNamespace[@]}")
    shift
    bwrap --bind / / --dev /dev --tmpfs /tmp --unshare-pid --proc /proc --unshare-net --unshare-uts \
        --die-with-parent "${flags[@]}" -- "$@" </dev/null >/dev/null 2>&1
}

# prootWorks: whether this container permits ptrace, which is all that proot needs.
prootWorks() {
    perl "$labLib/old-syscalls.pl" proot -r / /bin/true </dev/null >/dev/null 2>&1
}

# pickWay [COMMAND...]: picks the best way in which COMMAND (default: true) works. OVRADR_LAB_WAY
# forces one. False, with the reason in labWhy, if there is none.
pickWay() {
    (($#)) || set -- true
    labWay=${OVRADR_LAB_WAY-}
    case $labWay in
    root | user)
        labWhy="OVRADR_LAB_WAY asks for it"
        wayTry "$labWay" "$@" && return
        labWhy="OVRADR_LAB_WAY asks for namespaces made as $labWay, and this machine refuses them"
        return 1
        ;;
    proot)
        labWhy="OVRADR_LAB_WAY asks for it"
        prootWorks && return
        labWhy="OVRADR_LAB_WAY asks for proot, and proot is missing or may not trace here"
        return 1
        ;;
    "") ;;
    *)
        labWhy="OVRADR_LAB_WAY is \"$labWay\"; it can be root, user or proot"
        return 1
        ;;
    esac
    if ((EUID == 0)) && wayTry root "$@"; then
        labWay=root labWhy="this is root and may make namespaces"
        return
    fi
    if wayTry user "$@"; then
        labWay=user labWhy="this user may make a user namespace"
        return
    fi
    if prootWorks; then
        labWay=proot labWhy="this machine refuses namespaces of our own"
        return
    fi
    # shellcheck disable=SC2034 # read by the callers
    labWhy="this machine refuses namespaces, and proot is missing or may not trace: install the Debian packages bubblewrap and proot (scripts/install-deps lab does it), or allow one of the two"
    return 1
}

# pickLabWay: picks the best way for a whole lab. The check is passed as text, because the checkout
# may not be visible in the trial's namespaces.
pickLabWay() { pickWay bash -c "$(<"$labLib/can-switch.sh")"; }

# wayText WAY: a description of that way.
wayText() {
    case $1 in
    root) printf 'root: network and mount namespaces, two links a node' ;;
    user) printf 'user: network and mount namespaces inside a user namespace, two links a node' ;;
    proot) printf 'proot: file views by proot, loopback addresses, no links of their own' ;;
    esac
}
