// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrnode/node_candidates.h>

#include <cstddef>
#include <string>
#include <vector>

namespace Ovradr {

/// "3 s", "5 min", "2 h", "4 d"; "" for a negative age.
std::string ageText(double seconds);

/// "yes, 2 s ago"; "was no, 41 s ago" for what is asked again before it is used; "unknown".
std::string verdictText(const OvraDRNode::CachedVerdict &verdict);

/// The id cut to its first eight characters, which are enough to find it again as a rule.
std::string shortId(const std::string &id);

/// The candidate over which a request goes now, as far as the caches tell; null when every one is
/// passed over.
const OvraDRNode::NodeCandidate *winner(const std::vector<OvraDRNode::NodeCandidate> &candidates);

/// Why a request treats the candidate as its outlook says: what comes behind "next: " and the like.
std::string reasonText(const std::vector<OvraDRNode::NodeCandidate> &candidates,
                       std::size_t position);

/// Whether the node answers: the verdict on the endpoint that a request takes now, and when all are
/// held unreachable, on the first.
OvraDRNode::CachedVerdict reachability(const std::vector<OvraDRNode::NodeCandidate> &candidates);

} // namespace Ovradr
