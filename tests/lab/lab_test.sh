#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# lab_test.sh SCENE WAY [PROGRAM]: one scene of the lab or the sandbox in that way; PROGRAM is the test
# program of the node database. Exit code 77 if the machine does not allow the way, or the way lacks
# the tested feature.
set -euo pipefail
# shellcheck source=tests/lab/expect.sh
. "$(dirname "$0")/expect.sh"
# shellcheck source=lab/lib/ports.sh
. "$root/lab/lib/ports.sh"
# shellcheck source=lab/lib/view.sh
. "$root/lab/lib/view.sh"
scene=$1 way=$2 testProgram=${3-}
export OVRADR_LAB_WAY=$way OVRADR_LAB_DIR=$scratch/lab
# A word that identifies processes of this scene from outside.
mark=31${RANDOM}${BASHPID}
echo "$mark" >"$scratch/mark"

finish() {
    "$root/lab/lab" down >/dev/null 2>&1 || true
    OVRADR_LAB_DIR=$scratch/lab2 "$root/lab/lab" down >/dev/null 2>&1 || true
    chmod -R u+rwX "$scratch"
    rm -rf "$scratch"
}
trap finish EXIT

lab() { "$root/lab/lab" "$@"; }
sandbox() { "$root/lab/sandbox" "$@"; }
nothingRuns() { ! grep -sqzF -f "$scratch/mark" /proc/[0-9]*/cmdline; }
# Of this scene only: other tests have their own sandboxes at the same time.
noFolderIsLeft() { ! compgen -G "/tmp/ovl.*/root/usr/ovra/$mark" >/dev/null; }
requireLinks() { [[ $way != proot ]] || skip "nodes made by proot have no links of their own"; }
skip() {
    echo "skipped: $*"
    exit 77
}

# programs SETUP DAEMON: stand-ins for the two programs, as scripts.
programs() {
    mkdir -p "$scratch/bin"
    printf '#!/bin/bash\n%s\n' "$1" >"$scratch/bin/ovradr"
    printf '#!/bin/bash\n%s\n' "$2" >"$scratch/bin/ovradrd"
    chmod +x "$scratch/bin/ovradr" "$scratch/bin/ovradrd"
    export OVRADR_LAB_PREFIX=$scratch
}

sandboxKeepsThePathsPrivate() {
    local seen folder path
    local fill='for path in /usr/ovra/x /tmp/.ovradrcache /run/lock/x /dev/log; do
        [[ ! -e $path ]] || echo "already there: $path"
        echo mine >"$path"; stat -c %s "$path"; mv "$path" "$path.moved"; cat "$path.moved"
    done; stat -c %a /usr/ovra; [[ -O /usr/ovra ]] && echo yes'
    for folder in "$scratch" "$scratch" /run/lock; do
        cd "$folder"
        seen=$(sandbox bash -c "$fill" | tr '\n' ' ')
        same "own, empty, writable, owned by who runs it" "$seen" "5 mine 5 mine 5 mine 5 mine 755 yes "
    done
    for path in /usr/ovra/x /tmp/.ovradrcache /run/lock/x /dev/log; do
        [[ ! -e $path.moved ]] || broken "$path got out"
    done
}

# The machine's own node, simulated in a sandbox, so that a failure harms nobody.
testProgramsRunInASandboxOnly() {
    local outside case=--gtest_filter=NodeDb.CountsTheCredentialsOfANode
    ends "the case inside" 0 "[  PASSED  ] 1 test" sandbox "$testProgram" "$case"
    # Both the variable and the view are required; either may exist without the other.
    for outside in 'unset OVRADR_SANDBOX' "rmdir $viewMark"; do
        # shellcheck disable=SC2016 # expanded in the sandbox
        exitCodeOf sandbox bash -c "$outside"'
            mkdir -p /usr/ovra/etc/ovradr /tmp/.ovradrcache
            echo mine | tee /usr/ovra/etc/ovradr/node.{db,info} /tmp/.ovradrcache/x /run/lock/x >/dev/null
            files() { find /usr/ovra /tmp/.ovradrcache /run/lock -printf "%p %s %i %T@ %C@\n"; }
            before=$(files) code=0
            "$@" || code=$?
            [[ $(files) == "$before" ]] || echo "the files were touched"
            exit "$code"' outside "$testProgram" "$case"
        same "exit code after $outside" "$code" 2
        [[ $output != *touched* ]] || broken "after $outside: $output"
    done
    ends "the list outside" 0 NodeDb. "$testProgram" --gtest_list_tests
    # Outside, with no case selected: there is nothing to do, and still it refuses.
    ends "how to run it" 2 "$root/lab/sandbox $testProgram --gtest_filter=-*" \
        env OVRADR_SANDBOX=yes "$testProgram" --gtest_filter=-*
    holds "how to debug it" "$output" "$root/lab/sandbox gdb --args $testProgram --gtest_filter=-*"
}

sandboxPassesWhatGoesInAndOut() {
    local expected
    for expected in 0 7 255; do
        ends "a command" "$expected" "" sandbox bash -c "sleep $mark & exit $expected"
        eventually "what the command left running is gone" nothingRuns
    done
    exitCodeOf sandbox "$scratch/no-such-program"
    ((code)) || broken "a program that does not exist counts as success"
    cd "$scratch"
    output=$(echo input | GIVEN=given sandbox bash -c 'cat; echo "$PWD $GIVEN $OVRADR_LAB_WAY"; echo made >file')
    same "standard input, folder, environment" "$output" "input"$'\n'"$scratch given $way"
    same "a file of the working folder" "$(<file)" made
}

# signalled SIGNAL COMMAND...: COMMAND fails, with this code, if it gets the signal as soon as $scratch/runs is
# there.
signalled() {
    rm -f "$scratch/runs"
    # A shell starts background jobs with SIGINT ignored, nohup with SIGHUP; this one must receive them.
    perl -e '$SIG{INT} = $SIG{HUP} = "DEFAULT"; exec @ARGV' "${@:2}" >"$scratch/out" 2>&1 &
    eventually "the command runs" test -e "$scratch/runs"
    kill -"$1" $!
    wait $! && broken "SIG$1 counts as success" || code=$?
}

sandboxLeavesNothingAfterASignal() {
    local signal
    for signal in TERM INT HUP KILL; do
        signalled "$signal" "$root/lab/sandbox" \
            bash -c "touch '/usr/ovra/$mark' '$scratch/runs'; env -i sleep $mark & sleep $mark"
        eventually "no process is left after SIG$signal" nothingRuns
        eventually "no folder is left after SIG$signal" noFolderIsLeft
    done
}

nodesAreApart() {
    lab up 2 --no-daemon >/dev/null
    lab run 1 -- bash -c 'echo one >/usr/ovra/x; echo one >/tmp/.ovradrcache; logger -p user.err "from one"'
    ends "the other node with its own files" 5 "cannot access '/usr/ovra/x'" \
        lab run 2 -- bash -c 'ls -d /usr/ovra/x /tmp/.ovradrcache; exit 5'
    same "a node keeps its files from one command to the next" "$(lab run 1 -- cat /usr/ovra/x)" one
    eventually "the node's log has the line" eval 'lab log 1 | grep -q "err .*from one"'
    same "the other node's log" "$(lab log 2)" ""
    exitCodeOf lab run 1 -- bash -c 'for ((i = 0; i < 700; i++)); do printf 0123456789; done | logger'
    eventually "a long message is whole" eval '(($(lab log 1 | wc -c) > 7000))'
    [[ $way == proot ]] || same "host name" "$(lab run 2 -- hostname)" node-2
    same "standard input" "$(echo hello | lab run 2 -- cat)" hello
    # Another lab beside this one.
    OVRADR_LAB_DIR=$scratch/lab2 lab up 1 --no-daemon >/dev/null
    ends "a look from the second lab at files of the first" 1 "" \
        env OVRADR_LAB_DIR="$scratch/lab2" "$root/lab/lab" run 1 -- test -e /usr/ovra/x
    ends "a lab of the same name" 1 "is up already" lab up 1 --no-daemon
    OVRADR_LAB_DIR=$scratch/lab2 lab down >/dev/null
    lab run 1 -- test -e /usr/ovra/x || broken "the first lab went down with the second"
    lab down >/dev/null
    [[ ! -e $OVRADR_LAB_DIR ]] || broken "the folder of the lab is left"
    same "down again" "$(lab down)" "lab: no lab is up"
}

# listen NODE ADDRESS: answers one connection with "hello".
listen() {
    lab run "$1" -- perl -MIO::Socket::INET -e '
        my $listener = IO::Socket::INET->new(LocalAddr => $ARGV[0], LocalPort => 5999, Listen => 9,
            ReuseAddr => 1) or die $!;
        while (my $peer = $listener->accept) { print $peer "hello\n" }' "$2" &
    eventually "node $1 listens on $2" reaches "$1" "$2"
}
# reaches NODE ADDRESS: whether NODE gets the answer from there within 2 seconds.
reaches() {
    [[ $(lab run "$1" -- timeout 2 bash -c 'cat <"/dev/tcp/$0/5999"' "$2" 2>/dev/null </dev/null) == hello ]]
}

nodesReachEachOther() {
    lab up 2 --no-daemon >/dev/null
    listen 2 "$(lab addr 2)"
    reaches 1 "$(lab addr 2)" || broken "node 1 does not reach node 2"
    if [[ $way == proot ]]; then
        ends "cut without links" 1 "needs links of the lab's own" lab cut 2 0
    else
        listen 2 "$(lab addr 2 1)"
        reaches 1 "$(lab addr 2 1)" || broken "node 1 does not reach node 2 on the second link"
        ! grep -F 10.77. /proc/net/fib_trie || broken "the machine has an address of the lab"
    fi
}

linksAreCutDroppedAndRestored() {
    local first second
    requireLinks
    lab up 2 --no-daemon >/dev/null
    first=$(lab addr 2 0) second=$(lab addr 2 1)
    listen 2 "$first"
    listen 2 "$second"
    while read -r how carrier; do
        lab "$how" 2 0
        holds "the node's own view of its link" "$(lab run 2 -- ip -o link show eth0 </dev/null)" "$carrier"
        ! reaches 1 "$first" || broken "$how lets the first link through"
        reaches 1 "$second" || broken "$how of the first link stops the second"
        lab restore 2 eth0
        eventually "the link works again after $how" reaches 1 "$first"
    done <<-'END'
	cut NO-CARRIER
	drop LOWER_UP
	END
    ends "a link that is not there" 1 "the links are 0 (eth0) and 1 (eth1)" lab cut 2 7
}

# lostPackets ADDRESS: how many of 1,000 datagrams from node 1 do not reach node 2.
lostPackets() {
    rm -f "$scratch/lost"
    lab run 2 -- perl -MIO::Socket::INET -e '
        my $in = IO::Socket::INET->new(LocalAddr => $ARGV[0], LocalPort => 9, Proto => "udp") or die;
        $in->setsockopt(SOL_SOCKET, SO_RCVBUF, 4 << 20);
        print "ready\n"; STDOUT->flush; my $lost = 1000;
        while (1) { my $ready = ""; vec($ready, fileno $in, 1) = 1;
            select($ready, undef, undef, 2) or last; recv $in, my $one, 9, 0; $lost-- }
        print "$lost\n"' "$1" </dev/null >"$scratch/lost" &
    eventually "the receiver listens" grep -qs ready "$scratch/lost"
    lab run 1 -- perl -MIO::Socket::INET -e '
        my $out = IO::Socket::INET->new(PeerAddr => $ARGV[0], PeerPort => 9, Proto => "udp") or die;
        for (1 .. 1000) { send $out, "x", 0; select undef, undef, undef, 0.01 unless $_ % 20 }' "$1"
    wait $!
    tail -n 1 "$scratch/lost"
}

# A busy machine loses some anyway.
few() { (($1 < 20)) || broken "of 1000 datagrams $1 were lost $2"; }

linksAreShaped() {
    local address lost took
    requireLinks
    lab up 2 --no-daemon >/dev/null
    address=$(lab addr 2 0)
    few "$(lostPackets "$address")" "on a plain link"
    lab shape 2 0 --loss 20% --rate 100mbit
    lost=$(lostPackets "$address")
    ((lost > 130 && lost < 300)) || broken "of 1000 datagrams $lost were lost instead of about 200"
    holds "the status" "$(lab status)" "eth0 up (rate 100000 kbit/s loss 20.00 %)"
    lab shape 2 --off
    few "$(lostPackets "$address")" "afterwards"
    listen 2 "$address"
    exitCodeOf lab shape 2 0 --delay 60ms
    if [[ $code == 0 ]]; then
        took=$(lab run 1 -- perl -MTime::HiRes=time -MIO::Socket::INET -e '
            my $start = time; IO::Socket::INET->new(PeerAddr => $ARGV[0], PeerPort => 5999) or die;
            printf "%d", (time - $start) * 1000' "$address")
        ((took >= 60 && took < 500)) || broken "a round trip of 60 ms took $took ms"
    else
        holds "why packets cannot be delayed" "$output" "/dev/net/tun"
    fi
    lab shape 2 --off
    reaches 1 "$address" || broken "the link does not work after --off"
    ends "a rate that is none" 1 "write for example" lab shape 2 0 --rate fast
}

# cleared WHAT: that nothing is left of the lab.
cleared() {
    eventually "the folder is gone $1" eval '[[ ! -e $OVRADR_LAB_DIR ]]'
    eventually "the processes are gone $1" nothingRuns
}

failedStartIsShownAndCleared() {
    programs 'echo "no room left"; exit 4' "exec sleep $mark"
    ends "which step failed" 1 "ovradr setup returned 4" lab up 2
    holds "what the program said" "$output" "no room left"
    cleared "after setup failed"
    programs 'exit 0' "logger -p daemon.err 'port taken'; exit 5"
    ends "which step failed" 1 "ovradrd ended with exit code 5" lab up 2
    holds "what it logged" "$output" "port taken"
    cleared "after the daemon failed"
    # A daemon that answers once and then no more.
    programs 'exit 0' "exec sleep $mark"
    printf '#!/bin/sh\ncase "$*" in *--fail-early*) exit 7 ;; esac\n' >"$scratch/bin/curl"
    chmod +x "$scratch/bin/curl"
    ends "a node that falls silent" 1 "node-1 does not answer" lab up 1
    cleared "after a node fell silent"
    rm "$scratch/bin/ovradrd" "$scratch/bin/curl"
    ends "a program that is not there" 1 "ovradrd is not installed in $scratch" lab up 2
    cleared "after a program was missing"
}

interruptedStartIsCleared() {
    local signal
    programs 'exit 0' "touch '$scratch/runs'; exec sleep $mark"
    for signal in INT TERM KILL; do
        signalled "$signal" "$root/lab/lab" up 2
        same "exit code after SIG$signal" "$code" $((128 + $(kill -l "$signal")))
        cleared "after SIG$signal"
    done
}

killedKeeperIsCleared() {
    lab up 2 --no-daemon >/dev/null
    lab run 1 -- bash -c "setsid -f sleep $mark >/dev/null 2>&1"
    kill -KILL "$(<"$OVRADR_LAB_DIR/keeper.pid")"
    ends "a lab without its keeper" 0 "" eventually "the lab counts as gone" eval '! lab run 1 -- true >/dev/null 2>&1'
    lab down >/dev/null
    cleared "after the keeper was killed"
    lab up 1 --no-daemon >/dev/null
    kill -KILL "$(<"$OVRADR_LAB_DIR/keeper.pid")"
    lab up 1 --no-daemon >/dev/null
    same "a new lab takes the place" "$(lab run 1 -- echo there)" there
}

lab way >/dev/null 2>&1 || skip "this machine does not allow the way $way"
takePorts "$way"
"$scene"
