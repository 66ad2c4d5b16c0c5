// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/dr_node.h"

#include "words.h"

#include <ovradrcore/log.h>

namespace OvraDRNode {

using OvraDRCore::SqliteValueList;

DRNode::DRNode(const std::string &nodeId_, const std::string &credId_)
    : nodeId(nodeId_)
    , credId(credId_) {}

DRNode::DRNode(const std::string &nodeId_, const Conn &conn_, const std::string &session_)
    : nodeId(nodeId_)
    , conn(conn_)
    , session(session_) {}

bool DRNode::setNodeId(const std::string &id) {
    if (id.empty()) {
        OVRA_ERR("Empty node id is not allowed.");
        return false;
    }
    nodeId = id;
    return true;
}

bool DRNode::setCredId(const std::string &id) {
    if (id.empty()) {
        OVRA_ERR("Empty credId is not allowed.");
        return false;
    }
    credId = id;
    return true;
}

bool DRNode::setConn(const Conn &value) {
    if (!value.isValid()) {
        return false;
    }
    conn = value;
    return true;
}

bool DRNode::setSession(const std::string &value) {
    if (value.empty()) {
        return false;
    }
    session = value;
    return true;
}

bool DRNode::isValid() const {
    if (nodeId.empty() || credId.empty()) {
        return false;
    }
    if (nodeId == credId && isLocalNodeId(nodeId)) {
        return true;
    }
    return conn.isValid() && !session.empty();
}

Json::Value DRNode::toJson() const {
    Json::Value value = conn.toJson();
    value[Word::kCredId] = credId;
    value[Word::kNodeId] = nodeId;
    return value;
}

bool DRNode::fromJson(const Json::Value &value) {
    if (value.isNull()) {
        return true;
    }
    if (value.isObject()) {
        if (value[Word::kCredId].isString()) {
            credId = value[Word::kCredId].asString();
        }
        if (value[Word::kNodeId].isString()) {
            nodeId = value[Word::kNodeId].asString();
        }
    }
    // The endpoint that a peer reports is only checked, so that a malformed one is logged, and
    // never used: this node keeps the endpoint by which it reaches the peer.
    Conn::fromJson(value);
    return true;
}

std::vector<std::string> DRNode::ListSqliteField() const {
    std::vector<std::string> fields = conn.ListSqliteField();
    fields.insert(fields.end(), {Word::kCredId, Word::kNodeId, Word::kSession});
    return fields;
}

SqliteValueList DRNode::ToSqliteValues(const std::vector<std::string> &fields) const {
    SqliteValueList values = conn.ToSqliteValues(fields);
    for (const std::string &field : fields) {
        if (field == Word::kCredId) {
            values.AddValue(field, credId);
        } else if (field == Word::kNodeId) {
            values.AddValue(field, nodeId);
        } else if (field == Word::kSession) {
            values.AddValue(field, session);
        }
    }
    return values;
}

bool DRNode::FromSqliteValues(const SqliteValueList &row) {
    const bool hasCredId = row.GetValue(Word::kCredId, credId);
    const bool hasNodeId = row.GetValue(Word::kNodeId, nodeId);
    const bool hasSession = row.GetValue(Word::kSession, session);
    const bool hasConn = conn.FromSqliteValues(row);
    return hasCredId || hasNodeId || hasSession || hasConn;
}

} // namespace OvraDRNode
