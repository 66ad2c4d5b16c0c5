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
/// session that the remote node granted. In the local node's record both ids are the local node id.
class OVRADRNODE_EXPORT DRNode final : public OvraDRCore::SqliteRecord {
public:
    OvraDRCore::SqliteValueList
    ToSqliteValues(const std::vector<std::string> &fields) const override;
    /// Loads those of the record's columns that the row has; false if it has none.
    [[nodiscard]] bool FromSqliteValues(const OvraDRCore::SqliteValueList &row) override;
    /// "addr", "protocol", "port", "cred_id", "node_id", "session".
    std::vector<std::string> ListSqliteField() const override;

    DRNode() = default;
    DRNode(const std::string &nodeId, const std::string &credId);
    DRNode(const std::string &nodeId, const Conn &conn, const std::string &session);
    DRNode(const DRNode &) = default;
    DRNode &operator=(const DRNode &) = default;

    // Each returns false for an empty (or invalid) value and leaves the record unchanged.
    [[nodiscard]] bool setNodeId(const std::string &id);
    [[nodiscard]] bool setCredId(const std::string &id);
    [[nodiscard]] bool setConn(const Conn &value);
    [[nodiscard]] bool setSession(const std::string &value);

    /// Both ids, and either the local node's own record or a valid endpoint with a session.
    bool isValid() const;
    /// Members "cred_id", "node_id", "addr", "protocol" and "port"; never the session.
    Json::Value toJson() const;
    /// Sets the two ids, where present as strings; the endpoint is unchanged. Always true.
    bool fromJson(const Json::Value &value);

    /// The host name; "" if the system has none.
    static std::string getLocalHostName();
    /// The serial number; "" if there is none.
    static std::string getLocalSerial();
    /// The local node id, created on first use; "" if it can be neither read nor created. Reads the
    /// identity file under its lock, waiting up to 5 seconds for it.
    static std::string getLocalNodeId();
    /// Removes the identity file, so that the next getLocalNodeId() creates a new id.
    /// \return false if the lock could not be acquired within 5 seconds.
    [[nodiscard]] static bool resetLocalNodeId();
    /// The local node's own record.
    static DRNode getLocalNode();
    /// Conn::listLocal().
    static std::vector<Conn> getLocalConn();
    /// Compares with the local node id as this process first read it.
    static bool isLocalNodeId(const std::string &id);

    std::string nodeId;
    std::string credId;
    Conn conn;
    std::string session;
};

} // namespace OvraDRNode
