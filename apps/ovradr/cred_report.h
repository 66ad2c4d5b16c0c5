// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/dr_node.h>

#include <shared/session_release.h>

#include <string>

namespace Ovradr {

/// A credential as scripts see it; never its session.
Json::Value credJson(const OvraDRNode::DRNode &record, bool temporary);

/// A credential as people see it.
/// \param account  on the other appliance, or "" if unknown
std::string credText(const OvraDRNode::DRNode &record, bool temporary,
                     const std::string &account = "");

/// What happened to the session of a credential, in one sentence for people.
/// \param foreseen  nothing was done yet; the sentence says what would happen to it
std::string releaseText(const OvraApps::Release &release, bool foreseen);

/// The same for scripts: "session", and with a session that was left behind "reason" (code, name,
/// message) and "retried".
void addRelease(Json::Value &data, const OvraApps::Release &release);

/// Why a flow that makes or changes a credential failed.
/// \param sessionError  why the other appliance granted no session; code 0 for any other reason
/// \param conn          its endpoint
Refusal credFlowFailure(const OvraDRCore::ErrRecorder &flow,
                        const OvraDRCore::ErrRecorder &sessionError, const OvraDRNode::Conn &conn);

/// The failure of a flow behind another one that does not end.
Refusal busyFailure();

} // namespace Ovradr
