#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# init.sh FOLDER: the first program inside a lab made of namespaces, running as their root. Creates
# two switches in its own network namespace and, for every node, a network namespace with one link
# to each, a file view, a host name and a process namespace. When it ends, everything ends.
set -euo pipefail
lib=$(dirname "${BASH_SOURCE[0]}")
# shellcheck source=lab/lib/common.sh
. "$lib/common.sh"
# shellcheck source=lab/lib/view.sh
. "$lib/view.sh"
# shellcheck source=lab/lib/state.sh
. "$lib/state.sh"

lab=$1
count=$(<"$lab/count") prefix=$(<"$lab/prefix")

makeSwitches() {
    ip -batch - <<-'END'
	link add sw0 type bridge forward_delay 0 mcast_snooping 0
	link add sw1 type bridge forward_delay 0 mcast_snooping 0
	link set sw0 up
	link set sw1 up
	END
    # For `lab drop`. IPv4 only, so that ARP still works: packets go out and nothing comes back, as
    # behind a router that drops; a missing neighbour would be an immediate error.
    nft -f - <<-'END'
	table bridge lab {
	    set dropping { type ifname; }
	    chain forward {
	        type filter hook forward priority 0; policy accept;
	        ether type ip iifname @dropping drop
	        ether type ip oifname @dropping drop
	    }
	}
	END
}

# startNode NODE: the node's programs start once its links are connected; until then bubblewrap
# waits for a byte.
startNode() {
    local folder=$lab/n$1 info block pid i
    bwrapView "$labRoot" "$prefix" "$lab"
    mkfifo "$folder/plugged"
    exec {info}>"$folder/bwrap.json" {block}<>"$folder/plugged"
    rm "$folder/plugged"
    bwrap "${viewArgs[@]}" --unshare-pid --proc /proc --unshare-net --unshare-uts \
        --hostname "node-$1" --die-with-parent --info-fd "$info" --block-fd "$block" -- \
        /bin/bash "$labLib/node.sh" "$lab" "$1" </dev/null &
    exec {info}>&-
    for ((i = 0; i < 500; i++)); do
        pid=$(bwrapPid "$folder/bwrap.json") && break
        sleep 0.01
    done
    [[ -n $pid ]] || fail "node-$1: bubblewrap did not start it"
    ip -batch - <<-END
	link add n$1e0 type veth peer name eth0 netns $pid
	link add n$1e1 type veth peer name eth1 netns $pid
	link set n$1e0 master sw0 up
	link set n$1e1 master sw1 up
	END
    echo >&"$block"
    exec {block}>&-
}

makeSwitches
for ((i = 1; i <= count; i++)); do
    startNode "$i"
done
wait
