# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# Running a command under proot with the command's own end and exit code: by itself proot ends with
# the last process that it traces, returns that one's exit code, and ignores SIGTERM.

# asProot FOLDER COMMAND...: becomes proot, which runs COMMAND in the view of viewArgs; FOLDER is for its
# temporary files. In the environment:
# - OVRADR_DUMPABLE: proot, and who looks for its processes, reads the memory of the daemons.
# - MALLOC_ARENA_MAX, MALLOC_TOP_PAD_: proot notes the size of a process's heap (brk(2)) for each thread,
#   and fails calls with EFAULT whose path lies beyond the size that the thread found at its start. So
#   threads get arenas of their own, and the heap its size before there are threads.
asProot() {
    local folder=$1
    shift
    exec env OVRADR_DUMPABLE=1 MALLOC_ARENA_MAX=256 MALLOC_TOP_PAD_=33554432 "PROOT_TMP_DIR=$folder" \
        perl "$labLib/old-syscalls.pl" proot -v -1 "${viewArgs[@]}" -w / "$@"
}

# prootRun FOLDER COMMAND...: runs COMMAND in the view of viewArgs and returns its exit code (128 +
# signal if one ended it). Background processes keep running. FOLDER is private and gets a FIFO for
# the exit code. SIGINT, SIGTERM or SIGHUP kill the command and all that it started.
prootRun() {
    local folder=$1 fifo=$1/status.$BASHPID code="" part status
    shift
    mkfifo -m 600 "$fifo"
    # Opened read-write, so that neither side blocks.
    exec {status}<>"$fifo"
    rm -f "$fifo"
    asProot "$folder" \
        /bin/bash -c 'status=$1 folder=$2; shift 2
            cd -- "$folder" 2>/dev/null || cd /
            eval "\"\$@\" $status>&-" && code=0 || code=$?
            echo "$code" >&"$status"' sandbox "$status" "$PWD" "$@" <&0 &
    prootPid=$!
    disown "$prootPid"
    trap 'killTraced "$prootPid"; exit 130' INT
    trap 'killTraced "$prootPid"; exit 143' TERM
    trap 'killTraced "$prootPid"; exit 129' HUP
    # The time may be over in the middle of the code: what has been read of it is kept.
    until IFS= read -r -t 1 -u "$status" part; do
        code+=$part
        kill -0 "$prootPid" 2>/dev/null && continue
        # It may have ended in between.
        IFS= read -r -t 0.01 -u "$status" part || code="" part=137
        break
    done
    code+=$part
    trap - INT TERM HUP
    exec {status}>&-
    return "$code"
}

# killTraced PID: kills a proot and all processes that it traces.
killTraced() {
    local pids round
    for ((round = 0; round < 20; round++)); do
        mapfile -t pids < <(tracedBy | awk -v proot="$1" '$2 == proot { print $1 }')
        ((${#pids[@]})) || break
        kill -KILL "${pids[@]}" 2>/dev/null || true
    done
    kill -KILL "$1" 2>/dev/null || true
}
