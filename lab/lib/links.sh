# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# lab cut, lab drop, lab restore: done at the switch, so that a node sees what a real one would.
#   cut    the cable is unplugged: no carrier, and ARP fails
#   drop   the carrier stays and every IPv4 packet is silently dropped
# lab hide: blocks inbound connections to a node, not outbound ones, as behind a router with address
# translation.

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

labHide() {
    needLab
    needNode "${1-}"
    [[ $labWay != proot ]] ||
        fail "hide needs a firewall of the node's own; with proot all nodes share this machine's"
    (enterNode "$node" nft delete table ip hidden) 2>/dev/null || true
    if [[ ${2-} == --off ]]; then
        echo "lab: node-$node can be connected to"
        return
    fi
    (($# == 1)) || fail "lab hide NODE [--off]"
    (enterNode "$node" nft -f - || fail "node-$node could not be hidden") <<-'END'
	table ip hidden {
	    chain in {
	        type filter hook input priority 0; policy accept;
	        iif != lo tcp flags & (syn | ack) == syn drop
	    }
	}
	END
    echo "lab: node-$node cannot be connected to"
}
