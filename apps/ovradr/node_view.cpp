// SPDX-License-Identifier: Apache-2.0
#include "node_view.h"

#include "output.h"

#include <algorithm>

namespace Ovradr {

namespace {

using OvraDRNode::CachedVerdict;
using OvraDRNode::NodeCandidate;
using Outlook = NodeCandidate::Outlook;

} // namespace

std::string verdictText(const CachedVerdict &verdict) {
    if (!verdict.known) {
        return "unknown";
    }
    const std::string age = ageText(verdict.age);
    return std::string(verdict.fresh ? "" : "was ") + (verdict.value ? "yes" : "no") +
           (age.empty() ? "" : ", " + age + " ago");
}

const NodeCandidate *winner(const std::vector<NodeCandidate> &candidates) {
    const auto found =
        std::find_if(candidates.begin(), candidates.end(), [](const NodeCandidate &candidate) {
            return candidate.outlook == Outlook::kNext;
        });
    return found == candidates.end() ? nullptr : &*found;
}

std::string reasonText(const std::vector<NodeCandidate> &candidates, std::size_t position) {
    const NodeCandidate &candidate = candidates[position];
    switch (candidate.outlook) {
    case Outlook::kUnreachable:
        return "its endpoint did not answer";
    case Outlook::kInvalid:
        return "its record is not complete; pair again";
    case Outlook::kNext:
        if (candidate.remembered) {
            return "its node answered over it last";
        }
        return position == 0 ? "the first that may have the right"
                             : "those before it are passed over";
    case Outlook::kLater:
        break;
    }
    if (candidate.privilege.known && !candidate.privilege.value) {
        return "the last request over it failed, or was not permitted";
    }
    return "if those before it do not get through";
}

CachedVerdict reachability(const std::vector<NodeCandidate> &candidates) {
    const NodeCandidate *const next = winner(candidates);
    if (next != nullptr) {
        return next->reachable;
    }
    return candidates.empty() ? CachedVerdict() : candidates.front().reachable;
}

} // namespace Ovradr
