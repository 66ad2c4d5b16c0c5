# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# lab cut, lab drop, lab restore: done at the switch, so that a node sees what a real one would.
#   cut    the cable is out: no carrier, and neighbours are no longer found
#   drop   the carrier stays and every IPv4 packet vanishes: nobody is ever told

labLink() {
    local action=$1 port file element
    needLab
    needNode "${2-}"
    needLink "${3-}"
    [[ $labWay != proot ]] ||
        fail "$action needs links of the lab's own; with proot all nodes share the loopback interface"
    port=n${node}e$link
    file=$lab/n$node/link$link
    element="element bridge lab dropping { \"$port\" }"
    case $action:$(<"$file") in
    cut:up) (enterLab ip link set "$port" down) && echo cut >"$file" ;;
    drop:up) (enterLab nft add "$element") && echo dropping >"$file" ;;
    restore:cut) (enterLab ip link set "$port" up) && echo up >"$file" ;;
    restore:dropping) (enterLab nft delete "$element") && echo up >"$file" ;;
    restore:up | cut:cut | drop:dropping) ;;
    *) fail "eth$link of node-$node is $(<"$file"); restore it first" ;;
    esac
    echo "lab: eth$link of node-$node is $(<"$file")"
}
