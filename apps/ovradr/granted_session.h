// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovraplatform/session_store.h>

#include <string>
#include <vector>

namespace Ovradr {

/// A session that this node granted to others.
struct GrantedSession {
    OvraPlatform::SessionRecord record;
    std::string nodeId; ///< the node that it was granted to; "": tied to none, it ends by itself

    /// By which people name it; it opens nothing.
    std::string reference() const { return record.reference(); }
};

/// All of them, the oldest first. Log-ins of people are not among them.
[[nodiscard]] Expected<std::vector<GrantedSession>> grantedSessions();

/// As scripts see it; never its id.
Json::Value sessionJson(const GrantedSession &session);

/// A table for people.
std::string sessionTable(const std::vector<GrantedSession> &sessions);

/// Ends the sessions, up to the first that cannot be ended.
[[nodiscard]] Expected<void> endSessions(const std::vector<GrantedSession> &sessions);

} // namespace Ovradr
