// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "shared/pending_releases.h"

#include <ovradrnode/dr_node.h>

#include <functional>
#include <string>

namespace OvraApps {

/// What happened to a session on another node once this one no longer needed it.
struct Release {
    enum class State {
        kReleased,     ///< it was released
        kEndedAlready, ///< it had already ended
        kKept,         ///< another lasting credential of this node uses it
        kLeft,         ///< it may still be there: the node did not answer, or refused
    };

    State state = State::kLeft;
    int code = 0;            ///< with kLeft: why, a code of the library or of the web API
    Json::Value detail;      ///< with kLeft: what came with it
    bool remembered = false; ///< with kLeft: whether ovradrd will try again
};

/// "released", "ended_already", "kept" or "left_behind".
const char *releaseWord(Release::State state);

/// What would happen to the session if the credential were deleted now; changes nothing. kReleased:
/// the node would be told.
Release predictRelease(const OvraDRNode::DRNode &record);

struct FlowResult {
    bool done = false; ///< what the flow answered
    Release release;
};

/// Runs a flow of the library that makes the session of `record` superfluous and releases it if it
/// can, and finds out what happened to the session, which the flow itself does not report. The
/// release is noted before the flow and stays noted if it failed, even if this process is killed;
/// if it cannot be noted, the flow runs anyway.
///
/// \param conn  the endpoint over which the flow releases
FlowResult runWithRelease(const OvraDRNode::DRNode &record, const OvraDRNode::Conn &conn,
                          const std::function<bool()> &flow);

/// Deletes a credential, lasting or temporary: its row, then its session on the other node unless
/// a lasting credential still uses it. `done`: the row is gone, whatever the other node says.
FlowResult deleteCredential(const OvraDRNode::DRNode &record, bool temporary);

/// Tries a release that is pending, and forgets or postpones it in the store.
Release retryRelease(const PendingRelease &pending, PendingReleases &store);

} // namespace OvraApps
