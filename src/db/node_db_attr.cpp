// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "node_db"

// The attributes in the node database.

#include "ovradrnode/node_db.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode {

using OvraDRCore::InsertCommand;
using OvraDRCore::SelectCommand;
using OvraDRCore::SqliteAnd;
using OvraDRCore::SqliteEqual;
using OvraDRCore::SqliteValueList;
using OvraDRCore::UpdateCommand;

namespace {

SqliteAnd appFilter(const std::string &nodeId, const std::string &app) {
    return {SqliteEqual(Word::kNodeId, nodeId), SqliteEqual(Word::kApp, app)};
}

std::string attrFilter(const std::string &nodeId, const std::string &app, const std::string &attr) {
    return SqliteAnd(appFilter(nodeId, app), SqliteEqual(Word::kAttr, attr)).text;
}

bool selectValue(const std::string &nodeId, const std::string &app, const std::string &attr,
                 SqliteValueList &row) {
    SelectCommand command;
    command.SetTable(NodeAttrSqliteTable());
    command.AddField(Word::kValue);
    command.SetCondition(attrFilter(nodeId, app, attr));
    return NodeDBHandler::GetHandler().SelectRecord(command, row);
}

bool IsAttrExist(const std::string &nodeId, const std::string &app, const std::string &attr) {
    if (nodeId.empty() || app.empty()) {
        OVRA_ERR("Invalid nodeId[%s]/app[%s]", nodeId.c_str(), app.c_str());
        return false;
    }
    SqliteValueList row;
    if (!selectValue(nodeId, app, attr, row)) {
        OVRA_ERR("Failed to get attr[%s]/app[%s]/nodeId[%s]", attr.c_str(), app.c_str(),
                 nodeId.c_str());
        return false;
    }
    return !row.empty();
}

bool UpdateAttr(const DRNodeAttr &attr) {
    if (!attr.isValid()) {
        OVRA_ERR("invalid attr[%s]", OvraDRCore::toString(attr.toJson()).c_str());
        return false;
    }
    UpdateCommand command;
    command.SetTable(NodeAttrSqliteTable());
    command.AddFieldValue(Word::kValue, attr.value);
    command.SetCondition(attrFilter(attr.nodeId, attr.app, attr.attr));
    if (!NodeDBHandler::GetHandler().UpdateRecord(command)) {
        OVRA_ERR("Failed to update node");
        return false;
    }
    return true;
}

bool InsertAttr(const DRNodeAttr &attr) {
    if (!attr.isValid()) {
        OVRA_ERR("Failed to insert invalid attr[%s]", OvraDRCore::toString(attr.toJson()).c_str());
        return false;
    }
    InsertCommand command;
    command.SetTable(NodeAttrSqliteTable());
    command.AddFieldValue(Word::kNodeId, attr.nodeId);
    command.AddFieldValue(Word::kApp, attr.app);
    command.AddFieldValue(Word::kAttr, attr.attr);
    command.AddFieldValue(Word::kValue, attr.value);
    return NodeDBHandler::GetHandler().InsertRecord(command);
}

} // namespace

bool DRNodeDB::GetAttr(const std::string &nodeId, const std::string &app, const std::string &attr,
                       std::string &value) {
    if (nodeId.empty() || app.empty()) {
        OVRA_ERR("Invalid nodeId[%s]/app[%s]", nodeId.c_str(), app.c_str());
        return false;
    }
    SqliteValueList row;
    if (!selectValue(nodeId, app, attr, row) || !row.GetValue(Word::kValue, value)) {
        OVRA_ERR("Failed to get attr[%s]/app[%s]/nodeId[%s]", attr.c_str(), app.c_str(),
                 nodeId.c_str());
        return false;
    }
    return true;
}

bool DRNodeDB::ListAttr(const std::string &nodeId, const std::string &app,
                        std::vector<DRNodeAttr> &attrs) {
    if (nodeId.empty() || app.empty()) {
        OVRA_ERR("Invalid nodeId[%s]/app[%s]", nodeId.c_str(), app.c_str());
        return false;
    }
    SelectCommand command;
    command.SetTable(NodeAttrSqliteTable());
    command.AddField(Word::kAttr);
    command.AddField(Word::kValue);
    command.SetCondition(appFilter(nodeId, app));
    std::vector<SqliteValueList> rows;
    if (!NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        return false;
    }
    for (const SqliteValueList &row : rows) {
        DRNodeAttr found(nodeId, app, "", "");
        // A column that holds no text stays empty.
        (void)row.GetValue(Word::kAttr, found.attr);
        (void)row.GetValue(Word::kValue, found.value);
        attrs.push_back(found);
    }
    return true;
}

bool DRNodeDB::ListAppAttr(const std::string &app, std::vector<DRNodeAttr> &attrs) {
    if (app.empty()) {
        OVRA_ERR("Invalid app[%s]", app.c_str());
        return false;
    }
    SelectCommand command;
    command.SetTable(NodeAttrSqliteTable());
    command.AddField(Word::kNodeId);
    command.AddField(Word::kAttr);
    command.AddField(Word::kValue);
    command.SetCondition(SqliteEqual(Word::kApp, app));
    std::vector<SqliteValueList> rows;
    if (!NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        OVRA_ERR("Failed to list attrs of app[%s]", app.c_str());
        return false;
    }
    for (const SqliteValueList &row : rows) {
        DRNodeAttr found("", app, "", "");
        (void)row.GetValue(Word::kNodeId, found.nodeId);
        (void)row.GetValue(Word::kAttr, found.attr);
        (void)row.GetValue(Word::kValue, found.value);
        attrs.push_back(found);
    }
    return true;
}

bool DRNodeDB::DeleteAttr(const std::string &nodeId, const std::string &app,
                          const std::string &attr) {
    if (!DRNodeAttr(nodeId, app, attr, "").isValid()) {
        OVRA_ERR("Invalid nodeId[%s]/app[%s]/attr[%s]", nodeId.c_str(), app.c_str(), attr.c_str());
        return false;
    }
    if (!NodeDBHandler::GetHandler().DeleteRecord(attrFilter(nodeId, app, attr),
                                                  NodeAttrSqliteTable())) {
        OVRA_ERR("Failed to delete attr[%s]/app[%s]/nodeId[%s]", attr.c_str(), app.c_str(),
                 nodeId.c_str());
        return false;
    }
    return true;
}

bool DRNodeDB::SetAttr(const DRNodeAttr &attr) {
    if (!attr.isValid()) {
        OVRA_ERR("Failed to insert invalid attr[%s]", OvraDRCore::toString(attr.toJson()).c_str());
        return false;
    }
    return IsAttrExist(attr.nodeId, attr.app, attr.attr) ? UpdateAttr(attr) : InsertAttr(attr);
}

bool DRNodeDB::SetAttr(const std::string &nodeId, const std::string &app, const std::string &attr,
                       const std::string &value) {
    return SetAttr(DRNodeAttr(nodeId, app, attr, value));
}

} // namespace OvraDRNode
