#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# options_test.sh PROGRAM PAGE: the page names exactly the options of the program. OVRA_PAGES overrides
# the source tree.
set -euo pipefail
program=$1 page=$2
options() { grep -oE -- '--[a-z][a-z-]*' | sort -u; }

cd "${OVRA_PAGES:-$(dirname "$0")/../..}"
has=$("$program" --help | options)
# In code, but not in calls of other programs.
# shellcheck disable=SC2016
named=$(grep -oE '`[^`]*`|^    .*' "$page" | grep -vE '^`ovradr ' | options)
[[ -n $has && $has == "$named" ]] || {
    echo "$page names other options than $(basename "$program") --help shows; only in one of them:"
    comm -3 --output-delimiter='    named and not there: ' <(echo "$has") <(echo "$named") |
        sed 's/^--/there and not named: --/'
    exit 1
}
