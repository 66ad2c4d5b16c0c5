# SPDX-License-Identifier: Apache-2.0
# shellcheck shell=bash
# The file view of a node: /usr/ovra, /tmp/.ovradrcache, /run/lock and /dev/log are private,
# everything else is this machine's. Nothing is created on this machine: /usr, /tmp, /run and /dev
# become empty folders of the view, into which the machine's entries are mapped. Entries of /tmp and
# /run may disappear at any time, so those are mapped as symbolic links into /run/host, except for
# the parents of a path that must stay unchanged (the checkout, the working folder).

# A folder that marks such a view: the test programs check for it before they touch a fixed path.
viewMark=/run/host/ovradr-sandbox
# The maximum number of entries mapped from /tmp and from /run; bubblewrap takes 9,000 arguments in
# all.
viewLinkLimit=1000

# leadsTo ENTRY PATH...: whether ENTRY is one of the paths or a folder above one.
leadsTo() {
    local entry=$1 path
    shift
    for path; do
        [[ $path/ == "$entry"/* ]] && return
    done
    return 1
}

# isFixed ENTRY: whether the path is always private to the view.
isFixed() {
    case $1 in
    /usr/ovra | /tmp/.ovradrcache | /run/lock | /run/host | /dev/log) return 0 ;;
    esac
    return 1
}

# isOwn ENTRY: whether the view has a private one instead of the machine's. Other labs are left out
# too.
isOwn() {
    case $1 in
    /tmp/ovralab-* | /tmp/ovl.*) return 0 ;;
    esac
    isFixed "$1"
}

# entriesOf FOLDER: sets entries, at most viewLinkLimit of them.
entriesOf() {
    local shellOptions
    shellOptions=$(shopt -p nullglob dotglob) || true
    shopt -s nullglob dotglob
    entries=("$1"/*)
    eval "$shellOptions"
    entries=("${entries[@]:0:viewLinkLimit}")
}

# bwrapView PATH...: sets viewArgs to bubblewrap's arguments for the view; the PATHs stay unchanged.
bwrapView() {
    local entry folder
    viewArgs=(--bind / / --dev /dev --bind-try /dev/shm /dev/shm --dev-bind-try /dev/net /dev/net
        --tmpfs /usr --perms 1777 --tmpfs /tmp --tmpfs /run
        --bind /tmp /run/host/tmp --bind /run /run/host/run
        --dir /usr/ovra --perms 1777 --dir /run/lock --dir "$viewMark")
    entriesOf /usr
    for entry in "${entries[@]}"; do
        if isOwn "$entry"; then
            :
        elif [[ -L $entry ]]; then
            viewArgs+=(--symlink "$(readlink "$entry")" "$entry")
        else
            viewArgs+=(--bind "$entry" "$entry")
        fi
    done
    for folder in /tmp /run; do
        entriesOf "$folder"
        for entry in "${entries[@]}"; do
            if ! isFixed "$entry" && leadsTo "$entry" "$@"; then
                viewArgs+=(--bind "$entry" "$entry")
            elif ! isOwn "$entry"; then
                viewArgs+=(--symlink "/run/host$entry" "$entry")
            fi
        done
    done
}

# prootView FOLDER PATH...: makes FOLDER the root folder of a view and sets viewArgs to proot's
# arguments for it. Every mount point exists in FOLDER beforehand: otherwise proot would make up one
# without permissions.
prootView() {
    local root=$1 entry folder name
    local -A links=()
    local folders=() files=()
    shift
    viewArgs=(-r "$root")
    entriesOf ""
    for entry in "${entries[@]}"; do
        case $entry in
        /usr | /tmp | /run | /dev) continue ;;
        esac
        placeEntry "$entry"
    done
    entriesOf /usr
    for entry in "${entries[@]}"; do
        isOwn "$entry" || placeEntry "$entry"
    done
    for entry in /dev/{null,zero,full,random,urandom,tty,ptmx,pts,shm,net}; do
        [[ ! -e $entry ]] || placeEntry "$entry"
    done
    for folder in /tmp /run; do
        folders+=("$root/run/host$folder")
        viewArgs+=(-b "$folder:/run/host$folder")
        entriesOf "$folder"
        for entry in "${entries[@]}"; do
            if ! isFixed "$entry" && leadsTo "$entry" "$@"; then
                placeEntry "$entry"
            elif ! isOwn "$entry"; then
                links[$folder]+="/run/host$entry"$'\n'
            fi
        done
    done
    mkdir -p "$root"/{usr/ovra,tmp,run/lock,dev} "$root$viewMark" "${folders[@]}"
    ((${#files[@]} == 0)) || touch "${files[@]}"
    for folder in "${!links[@]}"; do
        if [[ $folder == /tmp || $folder == /run ]]; then
            mapfile -t entries <<<"${links[$folder]%$'\n'}"
            ln -s -t "$root$folder" -- "${entries[@]}"
        else
            ln -s -- "${links[$folder]}" "$root$folder"
        fi
    done
    for name in fd:/proc/self/fd stdin:/proc/self/fd/0 stdout:/proc/self/fd/1 stderr:/proc/self/fd/2; do
        ln -s "${name#*:}" "$root/dev/${name%%:*}"
    done
    chmod 1777 "$root/tmp" "$root/run/lock"
}

# placeEntry ENTRY: part of prootView; maps the machine's ENTRY to the same path.
placeEntry() {
    if [[ -L $1 ]]; then
        links[$1]=$(readlink "$1")
        return
    fi
    if [[ -d $1 ]]; then
        folders+=("$root$1")
    else
        files+=("$root$1")
    fi
    viewArgs+=(-b "$1")
}
