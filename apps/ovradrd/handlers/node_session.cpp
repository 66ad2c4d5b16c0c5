// SPDX-License-Identifier: Apache-2.0
#include "handlers/flow_error.h"
#include "handlers/handlers.h"
#include "handlers/params.h"

#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/session_walk.h>

#include <mutex>

namespace Ovradrd {

namespace {

using OvraDRNode::NodeSession;
using OvraPlatform::APICaller;

/// How long a session that is tied to no node lasts, in seconds: as long as a task that needs a
/// temporary credential reasonably takes, because a killed task never gives it back.
constexpr unsigned int kTemporaryTime = 3600;

Json::Value granted(const NodeSession &sessions, const std::string &session) {
    if (session.empty()) {
        return flowError(sessions, OvraDRCore::ERR::kSessionNotCreated);
    }
    Json::Value data(Json::objectValue);
    data["session"] = session;
    return OvraPlatform::apiSuccess(data);
}

/// A session for the caller's account, tied to a node.
Json::Value create(const Json::Value &params, const APICaller &caller) {
    Params in(params);
    const std::string nodeId = in.text("node_id", Params::kMaxId);
    if (!in.ok()) {
        return in.error();
    }
    // The search for the previous session and the grant of a new one are two steps. Only this
    // process grants any.
    static std::mutex granting;
    const std::lock_guard<std::mutex> lock(granting);
    const OvraPlatform::SessionWalk walk(
        {caller.user, NodeSession::kApplication, NodeSession::ExtraOf(nodeId)});
    NodeSession sessions;
    const std::string session = sessions.CreateNodeSession(nodeId, caller.user);
    return granted(sessions, session);
}

Json::Value createTemporary(const Json::Value & /*params*/, const APICaller &caller) {
    NodeSession sessions;
    const std::string session = sessions.CreateTempSession(caller.user, kTemporaryTime);
    return granted(sessions, session);
}

/// Whose session it is.
Json::Value get(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::string session = in.text("session", Params::kMaxSession);
    if (!in.ok()) {
        return in.error();
    }
    NodeSession sessions;
    const std::string account = sessions.GetUserBySession(session);
    if (account.empty()) {
        return flowError(sessions, OvraDRCore::ERR::kSessionUserUnknown);
    }
    Json::Value data(Json::objectValue);
    data["account"] = account;
    return OvraPlatform::apiSuccess(data);
}

/// One's own; any for an administrator.
Json::Value remove(const Json::Value &params, const APICaller &caller) {
    Params in(params);
    const std::string session = in.text("session", Params::kMaxSession);
    if (!in.ok()) {
        return in.error();
    }
    NodeSession sessions;
    if (caller.role != OvraPlatform::Role::kAdministrator) {
        const std::string owner = sessions.GetUserBySession(session);
        if (!owner.empty() && owner != caller.user) {
            return OvraPlatform::apiError(
                OvraPlatform::APIError::kNoPermission,
                "the session of somebody else: use an administrator's account");
        }
    }
    sessions.DeleteBySessionId(session);
    return sessions.GetErrCode() == OvraDRCore::ERR::kNone
               ? OvraPlatform::apiSuccess()
               : flowError(sessions, OvraDRCore::ERR::kSessionNotRemoved);
}

} // namespace

void addNodeSessionAPI(OvraPlatform::APIRegistry &registry) {
    using OvraPlatform::APIQueue;
    using OvraPlatform::APIRight;
    constexpr char kApi[] = "OVRA.DR.Node.Session";
    registry.add(kApi, 2, "create", APIRight::kPairing, APIQueue::kQuick, create);
    registry.add(kApi, 1, "temp_create", APIRight::kPairing, APIQueue::kQuick, createTemporary);
    // The holder of a session id may act as its user anyway.
    registry.add(kApi, 1, "get", APIRight::kSession, APIQueue::kQuick, get);
    registry.add(kApi, 1, "delete", APIRight::kPairing, APIQueue::kQuick, remove);
}

} // namespace Ovradrd
