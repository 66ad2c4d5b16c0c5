// SPDX-License-Identifier: Apache-2.0
#include "renewal.h"

#include "node_ref.h"
#include "node_view.h"
#include "output.h"
#include "target.h"

#include <ovraplatform/api_errors.h>

#include <algorithm>

namespace Ovradr {

Refusal credFailure(Refusal found, const std::string &credId) {
    if (found.value().code != OvraPlatform::APIError::kNoSession) {
        return found;
    }
    const Expected<FoundCred> cred = resolveCred(credId);
    if (!cred) {
        return found;
    }
    const std::string id = shortId(cred->record.credId);
    found.value().hint = cred->temporary
                             ? "It was temporary: run `ovradr cred delete " + id +
                                   "`, then `ovradr cred create " + targetText(cred->record.conn) +
                                   " --account NAME --temp`."
                             : "Log in again: `ovradr cred set " + id + " --account NAME`.";
    return found;
}

Refusal nodeFailure(Refusal found, const std::string &nodeId) {
    const auto candidates = OvraDRNode::listNodeCandidates(nodeId);
    const auto used = std::find_if(candidates.begin(), candidates.end(),
                                   [](const auto &candidate) { return candidate.remembered; });
    return used == candidates.end() ? found : credFailure(std::move(found), used->node.credId);
}

} // namespace Ovradr
