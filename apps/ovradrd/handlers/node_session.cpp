// SPDX-License-Identifier: Apache-2.0
#include "handlers/flow_error.h"
#include "handlers/handlers.h"
#include "handlers/params.h"
#include "shared/node_names.h"

#include <ovradrnode/node_db.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/session_walk.h>

#include <algorithm>
#include <mutex>
#include <vector>

namespace Ovradrd {

namespace {

using OvraDRNode::DRNodeDB;
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

/// Remembers what the node calls itself, for lists of who has access: it may be that nothing here
/// can ask it. What it gave is shown only where it can be shown.
void noteHostName(const std::string &nodeId, const Json::Value &given) {
    const std::string name = given.isString() ? given.asString() : "";
    if (!OvraApps::nodeNameProblem(name).empty()) {
        return;
    }
    std::vector<OvraDRNode::DRNodeAttr> attrs;
    const bool read = DRNodeDB::ListAttr(nodeId, OvraApps::kOwnApplication, attrs);
    const OvraDRNode::DRNodeAttr attr(nodeId, OvraApps::kOwnApplication, OvraApps::kHostNameAttr,
                                      name);
    const bool isKnown = std::any_of(attrs.begin(), attrs.end(), [&attr](const auto &other) {
        return other.attr == attr.attr && other.value == attr.value;
    });
    if (read && !isKnown) {
        (void)DRNodeDB::SetAttr(attr); // the log says why not
    }
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
    if (!session.empty()) {
        noteHostName(nodeId, params["_hostname"]);
    }
    return granted(sessions, session);
}

Json::Value createTemporary(const Json::Value & /*params*/, const APICaller &caller) {
    NodeSession sessions;
    const std::string session = sessions.CreateTempSession(caller.user, kTemporaryTime);
    return granted(sessions, session);
}

/// Whose session it is, and when it ends.
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
    const auto record = OvraPlatform::SessionStore().find(session);
    if (record && record->expires) {
        data["expires"] = Json::Int64{*record->expires};
    }
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
