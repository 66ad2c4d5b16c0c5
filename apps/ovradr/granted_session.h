// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "shared/node_names.h"

#include <ovraplatform/session_store.h>

#include <string>
#include <vector>

namespace Ovradr {

/// A session that this node granted to others.
struct GrantedSession {
    OvraPlatform::SessionRecord record;
    std::string nodeId; ///< the node it was granted to; "": tied to no node, ends by itself

    /// By which people name it; it grants no access.
    std::string reference() const { return record.reference(); }
};

/// All of them, oldest first, without log-ins of people.
[[nodiscard]] Expected<std::vector<GrantedSession>> grantedSessions();

/// The names of the nodes that have them.
OvraApps::NodeNames namesOf(const std::vector<GrantedSession> &sessions);

/// As scripts see it; never contains its id.
Json::Value sessionJson(const GrantedSession &session, const OvraApps::NodeNames &names);

/// A table for people.
std::string sessionTable(const std::vector<GrantedSession> &sessions);

/// Ends the sessions, stopping at the first failure.
[[nodiscard]] Expected<void> endSessions(const std::vector<GrantedSession> &sessions);

} // namespace Ovradr
