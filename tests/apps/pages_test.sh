#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# pages_test.sh OVRADRD_TEST OVRADR_TEST FARLINKD: the tests that compare the pages with the programs fail
# if one fact is removed from a page, and name it.
set -euo pipefail
# shellcheck source=tests/lab/expect.sh
. "$(dirname "$0")/../lab/expect.sh"
trap 'rm -rf "$scratch"' EXIT
ovradrdTest=$1 ovradrTest=$2 farlinkd=$3
export OVRA_PAGES=$scratch
registry() { missed "$1" docs/ovradrd.md "$2" "$root/lab/sandbox" "$ovradrdTest" --gtest_filter='Registry.Is*'; }
tree() { missed "$1" docs/ovradr.md "$2" "$root/lab/sandbox" "$ovradrTest" --gtest_filter="$3"; }

mkdir "$scratch/docs" "$scratch/lab"
for page in README.md CONTRIBUTING.md SECURITY.md lab/README.md $(cd "$root" && echo docs/*.md); do
    cp "$root/$page" "$scratch/$page"
done
registry 'no row for `OVRA.Core.User` 1 `get`' '/^| `OVRA.Core.User`/d'
registry 'correct the right of `OVRA.Core.Farlink` 1 `get`' 's/| local | quick/| session | quick/'
registry 'correct the queue of `OVRA.DR.Node.Credential` 1 `set`' '/1 `set`/s/outbound/quick/'
registry 'describes `OVRA.DR.Node` 1 `infos`' 's/^| `OVRA.DR.Node` 1 `info` .*/&\n| `OVRA.DR.Node` 1 `infos` | session | quick | | |/'
tree 'does not describe `ovradr attr list`' 's/`ovradr attr list [^`]*`//' CommandTree.IsDocumentedAsAWhole
tree 'has an option --retry' '/^| `--retry`/d' CommandTree.IsDocumentedAsAWhole
tree 'takes SUBJECT' 's/`ovradr doctor \[SUBJECT\]`/`ovradr doctor`/' CommandTree.IsDocumentedAsAWhole
tree 'there is no `ovradr user lists' 's/`ovradr user list`/`ovradr user lists`/' CommandTree.IsAllThatPagesMention
tree 'has no option --roles' 's/ovradr user add NAME \[--role ROLE\]/ovradr user add NAME [--roles ROLE]/' CommandTree.IsAllThatPagesMention
tree 'an option --forgot' 's/`--forget SESSION`/`--forgot SESSION`/' CommandTree.HasEveryOptionThatItsPageDescribes
tree 'add a row with the `data` of `why`' '/^| `why` /d' CommandTree.HasItsDocumentsForScriptsDescribed
tree '| 505 | `otp_wrong` | 5 |' '/^| 505 /d' Failure.IsDocumentedWithWhatItsCodeMeans
missed 'there and not named: --lease' docs/farlinkd.md '/^| `--lease /d' \
    bash "$root/tests/apps/options_test.sh" "$farlinkd" docs/farlinkd.md
