// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrnode/conn.h>

#include <json/value.h>

#include <string>

namespace OvraApps {

/// The other node's view of a session that it granted to this one.
enum class SessionState {
    kLive,    ///< it is accepted, and may change things there
    kGone,    ///< the node does not know it, or no longer
    kRefused, ///< the node knows it but denies it every right
    kSilent,  ///< no answer, or an untrusted one
};

struct SessionAnswer {
    SessionState state = SessionState::kSilent;
    /// Why it is neither live nor gone: a code of the library or of the web API, and what came
    /// with it.
    int code = 0;
    Json::Value detail;
};

/// Asks the node at `conn` about the session, under that session. Takes as long as a request, and
/// at most 10 seconds if there is no answer; an endpoint found dead in the last 5 seconds is not
/// asked.
SessionAnswer askSession(const OvraDRNode::Conn &conn, const std::string &session);

} // namespace OvraApps
