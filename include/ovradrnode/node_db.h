// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/dr_node_attr.h"
#include "ovradrnode/export.h"

#include <ovradrcore/sqlite_db.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// Credentials for reaching remote nodes.
class OVRADRNODE_EXPORT NodeCredSqliteTable : public OvraDRCore::SqliteTableHandler {
public:
    NodeCredSqliteTable();
    NodeCredSqliteTable(const NodeCredSqliteTable &) = default;
    ~NodeCredSqliteTable() override;
};

/// Credentials for short-lived use, with the same columns.
class OVRADRNODE_EXPORT TempCredSqliteTable : public OvraDRCore::SqliteTableHandler {
public:
    TempCredSqliteTable();
    TempCredSqliteTable(const TempCredSqliteTable &) = default;
    ~TempCredSqliteTable() override;
};

/// Attributes of nodes.
class OVRADRNODE_EXPORT NodeAttrSqliteTable : public OvraDRCore::SqliteTableHandler {
public:
    NodeAttrSqliteTable();
    NodeAttrSqliteTable(const NodeAttrSqliteTable &) = default;
    ~NodeAttrSqliteTable() override;
};

/// The newest schema of the node database that this library reads and writes, and the one that
/// `ovradr setup` makes.
inline constexpr int kNodeSchemaVersion = 1;

/// The node database, opened for one statement. It must have been provisioned (`ovradr setup`). One
/// with a newer schema is neither read nor changed: every operation fails and says so.
class OVRADRNODE_EXPORT NodeDBHandler : public OvraDRCore::SqliteDB {
public:
    NodeDBHandler();
    NodeDBHandler(NodeDBHandler &&) noexcept = default;
    ~NodeDBHandler() override;

    /// A new handler for every call.
    static NodeDBHandler GetHandler();
};

/// Access to the node database. Every operation opens it for one statement and closes it again.
/// False means a failure; an invalid argument, a list or a change that fails logs an ERR line, a
/// single credential that cannot be read does not. The local node has no row: for its id
/// DRNode::getLocalNode() is returned. What a record held before it is filled is lost.
class OVRADRNODE_EXPORT DRNodeDB {
public:
    /// Which credential tables to read, a bit set; both: node credentials first.
    enum CredType { CRED_TYPE_NODE = 1, CRED_TYPE_TEMP = 2 };
    friend constexpr CredType operator|(CredType left, CredType right) {
        return static_cast<CredType>(static_cast<int>(left) | static_cast<int>(right));
    }

    /// Deletes every node credential of the node; its temporary ones stay.
    [[nodiscard]] static bool Delete(const std::string &nodeId);
    /// Appends every credential. True even if a table could not be read (which is logged).
    static bool List(std::vector<DRNode> &nodes, CredType type);
    /// Appends the credentials of one node, like List(); false for an empty id.
    static bool ListCred(const std::string &nodeId, std::vector<DRNode> &nodes, CredType type);
    /// The first node credential of the node. For a node without any: true, and an invalid record
    /// that holds only the node id.
    [[nodiscard]] static bool Get(const std::string &nodeId, DRNode &node);
    /// The credential with this id, from either table; false if there is no valid one.
    [[nodiscard]] static bool GetCred(const std::string &credId, DRNode &node);
    /// The temporary credential with this id, even an incomplete and thus invalid one; false if
    /// there is none, or the table cannot be read.
    [[nodiscard]] static bool GetTempCred(const std::string &credId, DRNode &node);
    /// How many credentials the node has (temporary ones count only when there are no others); -1
    /// on an error.
    [[nodiscard]] static int IsNodeIdExist(const std::string &nodeId);
    /// Changes the endpoint of a node credential. True also if no credential has this id.
    [[nodiscard]] static bool SetConn(const std::string &credId, const Conn &conn);

    /// Reads one attribute; false if there is none.
    [[nodiscard]] static bool GetAttr(const std::string &nodeId, const std::string &app,
                                      const std::string &attr, std::string &value);
    /// Appends the attributes that the application stores about the node.
    [[nodiscard]] static bool ListAttr(const std::string &nodeId, const std::string &app,
                                       std::vector<DRNodeAttr> &attrs);
    /// Appends the attributes that the application stores, of all nodes.
    [[nodiscard]] static bool ListAppAttr(const std::string &app, std::vector<DRNodeAttr> &attrs);
    /// Removes one attribute. True also if there is none.
    [[nodiscard]] static bool DeleteAttr(const std::string &nodeId, const std::string &app,
                                         const std::string &attr);
    /// Adds or changes one attribute. The existence check and the write are two statements.
    [[nodiscard]] static bool SetAttr(const DRNodeAttr &attr);
    [[nodiscard]] static bool SetAttr(const std::string &nodeId, const std::string &app,
                                      const std::string &attr, const std::string &value);
};

} // namespace OvraDRNode
