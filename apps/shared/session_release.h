// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "shared/pending_releases.h"

#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_create.h>
#include <ovradrnode/node_set.h>

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

/// What became of a flow of the library that this appliance's other flows were kept out of.
enum class FlowState {
    kDone,
    kFailed, ///< the flow says why; the credential is as it was
    kGone,   ///< there is no such credential any more; the flow did not run
    kBusy,   ///< another flow concerning the same node kept SessionLock; this one did not run
};

struct FlowResult {
    FlowState state = FlowState::kFailed;
    // With kDone:
    OvraDRNode::DRNode before; ///< the row that the flow found
    OvraDRNode::DRNode after;  ///< the row as it is now; empty once deleted
    Release release;           ///< of the session of `before`, unless `after` has it too
};

// A flow reads the row again once nobody else can change it. It notes the release of that row's
// session before it begins and settles the note before anybody else can begin, so that a session
// stays noted if the release failed, even if this process is killed; if it cannot be noted, the
// flow runs anyway. Two rows never share a note.

/// Creates a credential with a node that the flow has met (CredCreate::getRemoteNodeInfo()). Its
/// session is noted as soon as the other node has granted it, until the row that uses it is stored.
[[nodiscard]] FlowState createCredential(OvraDRNode::CredCreate &flow);

/// Changes a lasting credential, and finds out what happened to its previous session, which the
/// flow itself does not report.
/// \param flow  has logged in at `conn`
/// \param conn  the new endpoint; a relay endpoint is stored as such
FlowResult changeCredential(OvraDRNode::DRNodeCredSet &flow, const OvraDRNode::DRNode &record,
                            const OvraDRNode::Conn &conn);

/// Deletes a credential, lasting or temporary: its row, then its session on the other node unless
/// a lasting credential still uses it. kDone: the row is gone, whatever the other node says, or was
/// gone before.
FlowResult deleteCredential(const OvraDRNode::DRNode &record, bool temporary);

/// How long retryRelease() waits for a flow that keeps the lock, in seconds. Short and then put
/// off, or the releases at a node whose flow does not end would hold up those at all others.
inline constexpr unsigned int kRetryPatience = 10;

/// Tries a release that is pending, and removes or postpones its note. Behind a flow that keeps the
/// lock it is postponed (kLeft with 107).
Release retryRelease(const PendingRelease &pending, PendingReleases &store,
                     unsigned int patience = kRetryPatience);

} // namespace OvraApps
