// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

namespace OvraDRNode {

/// The cached answer to one question; sends nothing.
struct CachedVerdict {
    bool known = false; ///< a value is stored
    bool value = true;  ///< the stored value; unknown counts as true
    bool fresh = false; ///< still valid; otherwise refreshed before use
    double age = -1;    ///< seconds since it was determined; -1: unknown, or stamped in the future
};

/// One credential of a node as a sender would find it now.
struct OVRADRNODE_EXPORT NodeCandidate {
    /// How a request sent now would use it, according to the caches.
    enum class Outlook {
        kNext,        ///< tried next
        kLater,       ///< tried if those before it fail
        kUnreachable, ///< skipped: its endpoint is considered unreachable
        kInvalid,     ///< skipped: the record has no session or no valid endpoint
    };

    DRNode node;
    bool temporary = false;
    bool remembered = false; ///< it worked last, or was found to have the right
    CachedVerdict reachable; ///< the endpoint answers
    /// The credential has the right on its node. False also if its last request got no answer.
    CachedVerdict privilege;
    Outlook outlook = Outlook::kLater;

    /// Members "cred_id", "endpoint" (an object), "temporary", "remembered", "reachable",
    /// "privilege" and "outlook"; never the session.
    Json::Value toJson() const;
};

/// Explains which credential a request to `nodeId` uses: the credentials in the order in which
/// NodeSender would try them. Reads the database and the caches and sends nothing. The remembered
/// credential comes first for 5 seconds, and longer while it may have the right; otherwise the
/// first lasting one that may. A sender refreshes stale entries first, which may change the order.
/// \return empty for an unknown node and for the local one.
OVRADRNODE_EXPORT std::vector<NodeCandidate> listNodeCandidates(const std::string &nodeId);

/// The same of every node that a credential reaches, by its id, at the cost of two statements and
/// of one reading of each cache file.
OVRADRNODE_EXPORT std::map<std::string, std::vector<NodeCandidate>> listAllNodeCandidates();

} // namespace OvraDRNode
