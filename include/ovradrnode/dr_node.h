// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <ovradrcore/sqlite_value.h>

#include <json/value.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// One credential that this node holds: which node it reaches, its own id, the endpoint, and the
/// session that the remote node granted. The local node is the record whose two ids are both the
/// local node id.
class OVRADRNODE_EXPORT DRNode final : public OvraDRCore::SqliteRecord {
public:
    OvraDRCore::SqliteValueList
    ToSqliteValues(const std::vector<std::string> &fields) const override;
    /// Loads whichever of the record's columns the row has; false when it has none.
    [[nodiscard]] bool FromSqliteValues(const OvraDRCore::SqliteValueList &row) override;
    /// "addr", "protocol", "port", "cred_id", "node_id", "session".
    std::vector<std::string> ListSqliteField() const override;

    DRNode() = default;
    DRNode(const std::string &nodeId, const std::string &credId);
    DRNode(const std::string &nodeId, const Conn &conn, const std::string &session);
    DRNode(const DRNode &) = default;
    DRNode &operator=(const DRNode &) = default;

    // Each refuses an empty (or invalid) value with false and leaves the record unchanged.
    [[nodiscard]] bool setNodeId(const std::string &id);
    [[nodiscard]] bool setCredId(const std::string &id);
    [[nodiscard]] bool setConn(const Conn &value);
    [[nodiscard]] bool setSession(const std::string &value);

    /// Both ids, and either the local node's own record or a valid endpoint with a session.
    bool isValid() const;
    /// Members "cred_id", "node_id", "addr", "protocol" and "port"; never the session.
    Json::Value toJson() const;
    /// Takes the two ids, where present as strings; the endpoint stays as it was. Always true.
    bool fromJson(const Json::Value &value);

    /// The host name; "" when the system gives none.
    static std::string getLocalHostName();
    /// The serial number; "" when there is none.
    static std::string getLocalSerial();
    /// The local node id, made on first use; "" when it can be neither read nor made. Reads the
    /// identity file under its lock, which it waits for up to 5 seconds.
    static std::string getLocalNodeId();
    /// Removes the identity file, so that the next getLocalNodeId() makes a new id.
    /// \return false when the lock could not be had within 5 seconds.
    [[nodiscard]] static bool resetLocalNodeId();
    /// The local node's own record.
    static DRNode getLocalNode();
    /// Conn::listLocal().
    static std::vector<Conn> getLocalConn();
    /// Compares with the local node id as it was when this process first asked.
    static bool isLocalNodeId(const std::string &id);

    std::string nodeId;
    std::string credId;
    Conn conn;
    std::string session;
};

} // namespace OvraDRNode
