#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# TestDownloadSpeed.sh URL RETRIES TIMEOUT: downloads URL, discards the bytes, and prints the speed
# from the first byte to the last as "NUMBER Mbit/s" (10^6 bits per second, one decimal) without a
# newline. Prints nothing if nothing can be measured; standard error says why.
#
# After a failure up to RETRIES further attempts follow, at most 10. TIMEOUT limits all of them
# together, in seconds, at most 600; 0 counts as 30. If it expires during the download, the received
# part is measured.
set -eu
export LC_ALL=C

mostBytes=1073741824
# A smaller part says little about the link: most of it fits into buffers along the path.
leastBytes=262144

fail() {
    printf 'TestDownloadSpeed.sh: %s\n' "$*" >&2
    exit 1
}

# number TEXT MOST NAME: TEXT as a number without leading zeros, at most MOST.
number() {
    case $1 in
    '' | *[!0-9]*) fail "$3 has to be a number, and not \"$1\"" ;;
    esac
    value=$(printf '%s' "$1" | sed 's/^0*//')
    value=${value:-0}
    # More digits than MOST has are more than MOST, and may be more than the shell counts with.
    [ ${#value} -le ${#2} ] && [ "$value" -le "$2" ] || value=$2
    printf '%s' "$value"
}

# now: seconds on a clock that nobody sets.
now() {
    read -r seconds _ </proc/uptime
    printf '%s' "${seconds%.*}"
}

# speedOf BYTES SECONDS-TO-FIRST-BYTE SECONDS
speedOf() {
    awk -v bytes="$1" -v first="$2" -v last="$3" 'BEGIN {
        seconds = last - first
        if (seconds < 0.000001) seconds = 0.000001
        printf "%.1f Mbit/s", bytes * 8 / 1000000 / seconds
    }'
}

[ $# -eq 3 ] || fail "usage: TestDownloadSpeed.sh URL RETRIES TIMEOUT"
url=$1
case $url in
http://* | https://*) ;;
*) fail "only http:// and https:// can be measured" ;;
esac
reason="the time was over"
tries=$(($(number "$2" 10 RETRIES) + 1))
timeout=$(number "$3" 600 TIMEOUT)
[ "$timeout" -gt 0 ] || timeout=30
end=$(($(now) + timeout))

while [ "$tries" -gt 0 ]; do
    tries=$((tries - 1))
    left=$((end - $(now)))
    [ "$left" -gt 0 ] || break
    # The bytes are discarded and nothing secret is sent, so the certificate is not verified. No
    # settings come from the environment or a file; redirects are not followed. head truncates at the
    # size limit, which ends curl.
    figures=$({
        curl -q --silent --show-error --fail --globoff --insecure --proto '=http,https' \
            --noproxy '*' --http1.1 --connect-timeout 10 --max-time "$left" --output - \
            --write-out '%{stderr}figures %{size_download} %{time_starttransfer} %{time_total}\n' \
            --url "$url" | head -c "$mostBytes" >/dev/null
    } 2>&1 || true)
    # shellcheck disable=SC2046 # the figures are three words
    set -- $(printf '%s\n' "$figures" | sed -n 's/^figures \([0-9]* [0-9.]* [0-9.]*\)$/\1/p')
    if [ $# -eq 3 ] && [ "$1" -ge "$leastBytes" ]; then
        speedOf "$@"
        exit 0
    fi
    # Without the address: the caller knows it, and it may contain a name that must stay secret.
    reason=$(printf '%s\n' "$figures" | sed -n 's/^curl: ([0-9]*) //p' | head -n 1)
    [ "$tries" -eq 0 ] || sleep 1
done
fail "${reason:-less than $leastBytes bytes came: use a larger file}"
