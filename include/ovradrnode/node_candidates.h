// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// What the caches say about one question, without asking anybody.
struct CachedVerdict {
    bool known = false; ///< something is stored
    bool value = true;  ///< what is stored; unknown counts as true
    bool fresh = false; ///< it will be believed; otherwise it is asked again before it is used
    double age = -1;    ///< seconds since it was found out; -1: unknown, or stamped in the future
};

/// One credential of a node as a sender to that node would meet it now.
struct OVRADRNODE_EXPORT NodeCandidate {
    /// What a request sent now would do with it, as far as the caches tell.
    enum class Outlook {
        kNext,        ///< tried next
        kLater,       ///< tried when those before it do not get through
        kUnreachable, ///< passed over: its endpoint is held unreachable
        kInvalid,     ///< passed over: the record has no session or no valid endpoint
    };

    DRNode node;
    bool temporary = false;
    bool remembered = false; ///< it worked last, or was found to have the right
    CachedVerdict reachable; ///< the endpoint answers
    CachedVerdict privilege; ///< the credential has the right on its node
    Outlook outlook = Outlook::kLater;

    /// Members "cred_id", "endpoint" (an object), "temporary", "remembered", "reachable",
    /// "privilege" and "outlook"; never the session.
    Json::Value toJson() const;
};

/// Why a request to `nodeId` goes the way that it goes: the credentials in the order in which
/// NodeSender would try them. Reads the database and the caches and sends nothing. The remembered
/// credential stands first for 5 seconds, and longer while it may have the right; else the first
/// lasting one that may. What is stale is asked again by whoever sends, and may then turn out
/// differently.
/// \return no candidate for a node that is not known, or is the local one.
OVRADRNODE_EXPORT std::vector<NodeCandidate> listNodeCandidates(const std::string &nodeId);

} // namespace OvraDRNode
