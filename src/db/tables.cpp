// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_db.h"
#include "paths.h"
#include "words.h"

namespace OvraDRNode {

namespace {

constexpr unsigned int kBusyTime = 20; // seconds

} // namespace

NodeCredSqliteTable::NodeCredSqliteTable()
    : SqliteTableHandler(Word::kNodeCredTable, "") {}
NodeCredSqliteTable::~NodeCredSqliteTable() = default;

TempCredSqliteTable::TempCredSqliteTable()
    : SqliteTableHandler(Word::kTempCredTable, "") {}
TempCredSqliteTable::~TempCredSqliteTable() = default;

NodeAttrSqliteTable::NodeAttrSqliteTable()
    : SqliteTableHandler(Word::kNodeAttrTable, "") {}
NodeAttrSqliteTable::~NodeAttrSqliteTable() = default;

NodeDBHandler::NodeDBHandler()
    : SqliteDB(Path::kDatabase, kBusyTime, Word::kInfoTable, kNodeSchemaVersion) {}
NodeDBHandler::~NodeDBHandler() = default;

NodeDBHandler NodeDBHandler::GetHandler() {
    return {};
}

} // namespace OvraDRNode
