// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrnode/node_candidates.h>

#include <cstddef>
#include <string>
#include <vector>

namespace Ovradr {

/// "yes, 2 s ago"; "was no, 41 s ago" for a verdict that is checked again before use; "unknown".
std::string verdictText(const OvraDRNode::CachedVerdict &verdict);

/// The candidate that a request would use now, according to the caches; null if all are passed
/// over.
const OvraDRNode::NodeCandidate *winner(const std::vector<OvraDRNode::NodeCandidate> &candidates);

/// Why a request treats the candidate as its outlook says: the text after "next: " and the like.
std::string reasonText(const std::vector<OvraDRNode::NodeCandidate> &candidates,
                       std::size_t position);

/// Whether the node answers: the verdict on the endpoint that a request would use now or, if all
/// are considered unreachable, on the first.
OvraDRNode::CachedVerdict reachability(const std::vector<OvraDRNode::NodeCandidate> &candidates);

} // namespace Ovradr
