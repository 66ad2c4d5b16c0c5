// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_db.h"

#include "words.h"

#include <ovradrcore/log.h>

namespace OvraDRNode {

using OvraDRCore::SelectCommand;
using OvraDRCore::SqliteEqual;
using OvraDRCore::SqliteTableHandler;
using OvraDRCore::SqliteValueList;
using OvraDRCore::UpdateCommand;

namespace {

/// \param nodeId  empty: the rows of every node
bool ListRecords(const SqliteTableHandler &table, const std::string &nodeId,
                 std::vector<SqliteValueList> &rows) {
    SelectCommand command;
    command.SelectAll();
    command.SetTable(table);
    if (!nodeId.empty()) {
        command.SetCondition(SqliteEqual(Word::kNodeId, nodeId));
    }
    if (!NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        OVRA_ERR("Failed to list cred from table [%s]", table.GetName().c_str());
        return false;
    }
    return true;
}

/// A table that cannot be read yields fewer records, not a failure: half of the credentials is
/// better than none.
void listNodes(const std::string &nodeId, std::vector<DRNode> &nodes, DRNodeDB::CredType type) {
    std::vector<SqliteValueList> rows;
    if ((type & DRNodeDB::CRED_TYPE_NODE) != 0) {
        ListRecords(NodeCredSqliteTable(), nodeId, rows);
    }
    if ((type & DRNodeDB::CRED_TYPE_TEMP) != 0) {
        ListRecords(TempCredSqliteTable(), nodeId, rows);
    }
    for (const SqliteValueList &row : rows) {
        DRNode node;
        if (node.FromSqliteValues(row)) {
            nodes.push_back(node);
        }
    }
}

/// Reads one row, whether or not the record is valid. A column that holds nothing stays empty.
bool readCred(const SqliteTableHandler &table, const std::string &credId, DRNode &node) {
    node = DRNode();
    SelectCommand command;
    command.SelectAll();
    command.SetTable(table);
    command.SetCondition(SqliteEqual(Word::kCredId, credId));
    SqliteValueList row;
    if (!NodeDBHandler::GetHandler().SelectRecord(command, row)) {
        return false;
    }
    return node.FromSqliteValues(row);
}

int GetNodeRecordNum(const std::string &nodeId, const SqliteTableHandler &table) {
    if (nodeId.empty()) {
        OVRA_ERR("Bad nodeId [%s]", nodeId.c_str());
        return -1;
    }
    SelectCommand command;
    command.AddField(Word::kNodeId);
    command.SetTable(table);
    command.SetCondition(SqliteEqual(Word::kNodeId, nodeId).text);
    std::vector<SqliteValueList> rows;
    if (!NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        return -1;
    }
    int count = 0;
    for (const SqliteValueList &row : rows) {
        std::string id;
        count += row.GetValue(Word::kNodeId).GetValue(id) ? 1 : 0;
    }
    return count;
}

} // namespace

bool DRNodeDB::List(std::vector<DRNode> &nodes, CredType type) {
    listNodes("", nodes, type);
    return true;
}

bool DRNodeDB::ListCred(const std::string &nodeId, std::vector<DRNode> &nodes, CredType type) {
    if (nodeId.empty()) {
        OVRA_ERR("Invalid nodeId [%s]", nodeId.c_str());
        return false;
    }
    listNodes(nodeId, nodes, type);
    return true;
}

bool DRNodeDB::Get(const std::string &nodeId, DRNode &node) {
    DRNode idOnly;
    if (!idOnly.setNodeId(nodeId)) {
        OVRA_ERR("Bad node Id[%s]", nodeId.c_str());
        return false;
    }
    if (DRNode::isLocalNodeId(nodeId)) {
        node = DRNode::getLocalNode();
        return true;
    }
    std::vector<DRNode> nodes;
    if (!ListCred(nodeId, nodes, CRED_TYPE_NODE)) {
        return false;
    }
    node = nodes.empty() ? idOnly : nodes.front();
    return true;
}

bool DRNodeDB::GetCred(const std::string &credId, DRNode &node) {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId [%s]", credId.c_str());
        return false;
    }
    if (DRNode::isLocalNodeId(credId)) {
        node = DRNode::getLocalNode();
        return true;
    }
    return (readCred(NodeCredSqliteTable(), credId, node) && node.isValid()) ||
           (readCred(TempCredSqliteTable(), credId, node) && node.isValid());
}

bool DRNodeDB::GetTempCred(const std::string &credId, DRNode &node) {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId [%s]", credId.c_str());
        return false;
    }
    return readCred(TempCredSqliteTable(), credId, node);
}

int DRNodeDB::IsNodeIdExist(const std::string &nodeId) {
    if (nodeId.empty()) {
        OVRA_ERR("Bad nodeId [%s]", nodeId.c_str());
        return -1;
    }
    const int count = GetNodeRecordNum(nodeId, NodeCredSqliteTable());
    return count < 1 ? GetNodeRecordNum(nodeId, TempCredSqliteTable()) : count;
}

bool DRNodeDB::SetConn(const std::string &credId, const Conn &conn) {
    if (credId.empty() || !conn.isValid()) {
        OVRA_ERR("invalid credId[%s] or conn", credId.c_str());
        return false;
    }
    UpdateCommand command;
    command.SetTable(NodeCredSqliteTable());
    command.AddFieldValue(Word::kAddr, conn.addr);
    command.AddFieldValue(Word::kProtocol, conn.protocol);
    command.AddFieldValue(Word::kPort, conn.port);
    command.SetCondition(SqliteEqual(Word::kCredId, credId));
    if (!NodeDBHandler::GetHandler().UpdateRecord(command)) {
        OVRA_ERR("Failed to update node");
        return false;
    }
    return true;
}

bool DRNodeDB::Delete(const std::string &nodeId) {
    const SqliteEqual condition(Word::kNodeId, nodeId);
    if (!NodeDBHandler::GetHandler().DeleteRecord(condition.text, NodeCredSqliteTable())) {
        OVRA_ERR("Failed to delete record of node [%s]", nodeId.c_str());
        return false;
    }
    return true;
}

} // namespace OvraDRNode
