# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# lab shape: makes a node's links slow, delayed or lossy.
#   rate    both directions, by a token bucket (tc) at both ends of the link
#   delay   added to the round trip: a program of ours between node and switch forwards every frame
#           after half of it. Not tc's netem, which container kernels lack.
#   loss    of the IPv4 packets in each direction, by the firewall of the switch

labShape() {
    local action=shape rate="" delay="" loss="" off=no shaped=(0 1)
    needLab
    needNode "${1-}"
    shift
    [[ $labWay != proot ]] ||
        fail "shape needs links of the lab's own; with proot all nodes share the loopback interface"
    if [[ ${1-} != --* && $# -gt 0 ]]; then
        needLink "$1"
        shaped=("$link")
        shift
    fi
    (($#)) || fail "say how: lab shape NODE [LINK] --rate 100mbit --delay 20ms --loss 5% --cut, or --off"
    while (($#)); do
        case $1 in
        --off) off=yes ;;
        --cut) action="cut" ;;
        --rate | --delay | --loss)
            (($# > 1)) || fail "$1 needs a value"
            readShape "$1" "$2"
            shift
            ;;
        *) fail "there is no \"$1\" in a shape; there are --rate, --delay, --loss, --cut and --off" ;;
        esac
        shift
    done
    [[ $off == no || $action$rate$delay$loss == shape ]] || fail "--off stands alone"
    [[ -z $delay ]] || needTaps
    for link in "${shaped[@]}"; do
        shapeLink
    done
}

# readShape OPTION VALUE: sets rate (bits a second), delay (ms) or loss (per 10,000).
readShape() {
    local -A units=([kbit]=1000 [mbit]=1000000 [gbit]=1000000000)
    case $1 in
    --rate)
        [[ $2 =~ ^([1-9][0-9]{0,5})(kbit|mbit|gbit)$ ]] ||
            fail "\"$2\" is no rate; write for example 512kbit, 100mbit or 1gbit"
        rate=$((BASH_REMATCH[1] * units[${BASH_REMATCH[2]}]))
        ;;
    --delay)
        [[ $2 =~ ^([1-9][0-9]{0,3})ms$ ]] || fail "\"$2\" is no delay; write for example 20ms"
        delay=${BASH_REMATCH[1]}
        ;;
    --loss)
        [[ $2 =~ ^([0-9]{1,2})(\.([0-9]{1,2}))?%$ ]] || fail "\"$2\" is no loss; write for example 0.5% or 5%"
        loss=${BASH_REMATCH[3]-}00
        loss=$((10#${BASH_REMATCH[1]} * 100 + 10#${loss:0:2}))
        ;;
    esac
}

# needTaps: fails if a program cannot forward frames here.
needTaps() {
    local why
    why=$( (enterLab perl "$labLib/delay.pl" --probe) 2>&1) ||
        fail "packets cannot be delayed here: ${why%.}; a delay needs a kernel with tun and a /dev/net/tun that this user may open, so leave --delay out"
}

# shapeLink: shapes one link of the node, from scratch.
shapeLink() {
    local port=n${node}e$link told=""
    clearShape "$port"
    if [[ $off == yes ]]; then
        rm -f "$lab/n$node/shape$link"
        echo "lab: eth$link of node-$node has no shape"
        return
    fi
    if [[ -n $delay ]]; then
        setDelay "$port"
        told+=" delay ${delay} ms"
    fi
    if [[ -n $rate ]]; then
        setRate
        told+=" rate $((rate / 1000)) kbit/s"
    fi
    if [[ -n $loss ]]; then
        dropSome "$port"
        told+=" loss $((loss / 100)).$(printf %02d $((loss % 100))) %"
    fi
    if [[ $action == cut ]]; then
        labLink cut "$node" "$link" >/dev/null
        told+=" cut"
    fi
    echo "${told# }" >"$lab/n$node/shape$link"
    echo "lab: eth$link of node-$node:$told"
}

# setRate: both directions. The burst is 10 ms, because the kernel's clock may tick only 100 times a
# second.
setRate() {
    local burst=$((rate / 8 / 100)) bucket
    ((burst >= 16384)) || burst=16384
    bucket=(tbf rate "${rate}bit" burst "$burst" latency 50ms)
    if ! (enterLab tc qdisc add dev "n${node}e$link" root "${bucket[@]}") ||
        ! (enterNode "$node" tc qdisc add dev "eth$link" root "${bucket[@]}"); then
        fail "the rate of eth$link of node-$node could not be set"
    fi
}

# setDelay PORT: disconnects the port from the switch, and inserts two TAP devices with a program in
# between.
setDelay() {
    local carrier=$lab/n$node/carrier$link
    rm -f "$carrier"
    (enterLab perl "$labLib/delay.pl" "$1a" "$1b" "$delay" >"$carrier" 2>&1 </dev/null) &
    disown
    for _ in {1..100}; do
        ! grep -sq . "$carrier" || break
        sleep 0.05
    done
    [[ $(cat "$carrier") == ready ]] || fail "eth$link of node-$node cannot be delayed: $(cat "$carrier")"
    (enterLab ip -batch - || fail "the delay of eth$link of node-$node could not be set") <<-END
	link add $1d type bridge forward_delay 0 mcast_snooping 0
	link set $1d up
	link set $1a master sw$link up
	link set $1b master $1d up
	link set $1 master $1d
	END
}

# dropSome PORT
dropSome() {
    (enterLab nft -f - || fail "the loss of eth$link of node-$node could not be set") <<-END
	table bridge loss_$1 {
	    chain forward {
	        type filter hook forward priority 1; policy accept;
	        iifname "$1" ether type ip numgen random mod 10000 < $loss drop
	        oifname "$1" ether type ip numgen random mod 10000 < $loss drop
	    }
	}
	END
}

# clearShape PORT
clearShape() {
    # Without its TAP device the program exits.
    (enterLab ip link del "$1a") 2>/dev/null || true
    (enterLab ip link del "$1d") 2>/dev/null || true
    (enterLab ip link set "$1" master "sw$link")
    (enterLab tc qdisc del dev "$1" root) 2>/dev/null || true
    (enterNode "$node" tc qdisc del dev "eth$link" root) 2>/dev/null || true
    (enterLab nft delete table bridge "loss_$1") 2>/dev/null || true
    [[ $off == no || $(<"$lab/n$node/link$link") != cut ]] || labLink restore "$node" "$link" >/dev/null
}
