// SPDX-License-Identifier: Apache-2.0
#include "granted_session.h"

#include "output.h"

#include <ovradrnode/node_session.h>

#include <set>

namespace Ovradr {

using OvraDRNode::NodeSession;
using OvraPlatform::SessionRecord;

Expected<std::vector<GrantedSession>> grantedSessions() {
    OvraPlatform::SessionStore store;
    std::vector<SessionRecord> records;
    if (!store.isOpen() || !store.list(records)) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    std::vector<GrantedSession> sessions;
    for (const SessionRecord &record : records) {
        if (record.app == NodeSession::kApplication) {
            sessions.push_back({record, NodeSession::NodeIdOf(record.extra)});
        }
    }
    return sessions;
}

OvraApps::NodeNames namesOf(const std::vector<GrantedSession> &sessions) {
    std::set<std::string> ids;
    for (const GrantedSession &session : sessions) {
        ids.insert(session.nodeId);
    }
    ids.erase("");
    return OvraApps::NodeNames(ids);
}

Json::Value sessionJson(const GrantedSession &session, const OvraApps::NodeNames &names) {
    Json::Value json;
    json["reference"] = session.reference();
    json["account"] = session.record.user;
    json["node_id"] = session.nodeId;
    json["name"] = names.of(session.nodeId).shown();
    json["client"] = session.record.remote;
    json["created"] = Json::Int64(session.record.created);
    json["expires"] =
        session.record.expires ? Json::Value(Json::Int64(*session.record.expires)) : Json::Value();
    return json;
}

std::string sessionTable(const std::vector<GrantedSession> &sessions) {
    const OvraApps::NodeNames names = namesOf(sessions);
    std::vector<std::vector<std::string>> rows;
    for (const GrantedSession &session : sessions) {
        const SessionRecord &record = session.record;
        rows.push_back({names.of(session.nodeId).shown(), shortId(session.reference()), record.user,
                        session.nodeId.empty() ? "(none)" : shortId(session.nodeId),
                        whenText(record.created),
                        record.expires ? whenText(*record.expires) : "never", record.remote});
    }
    return table({"NAME", "SESSION", "ACCOUNT", "GRANTED TO NODE", "SINCE", "ENDS", "CLIENT"},
                 rows);
}

Expected<void> endSessions(const std::vector<GrantedSession> &sessions) {
    NodeSession store;
    for (const GrantedSession &session : sessions) {
        store.DeleteBySessionId(session.record.id);
        if (store.GetErrCode() != OvraDRCore::ERR::kNone) {
            Refusal found = failureOf(store);
            found.value().message.insert(0, "The session " + session.reference() + ": ");
            return found;
        }
    }
    return {};
}

} // namespace Ovradr
