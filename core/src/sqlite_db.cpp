// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/sqlite_db.h"

#include <ovrabase/sqlite.h>

#include <sqlite3.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>

namespace OvraDRCore {

namespace {

/// The row as named values. Records hold no NULL, floating-point number or integer over 32 bits:
/// such a column reads as absent.
SqliteValueList rowOf(sqlite3_stmt *statement) {
    SqliteValueList row;
    const int columns = sqlite3_column_count(statement);
    for (int i = 0; i < columns; ++i) {
        const char *name = sqlite3_column_name(statement, i);
        const int type = sqlite3_column_type(statement, i);
        if (name == nullptr) {
            continue;
        }
        if (type == SQLITE_INTEGER) {
            const sqlite3_int64 number = sqlite3_column_int64(statement, i);
            if (number >= INT_MIN && number <= INT_MAX) {
                row.AddValue(name, static_cast<int>(number));
            }
        } else if (type == SQLITE_TEXT || type == SQLITE_BLOB) {
            const void *bytes = sqlite3_column_blob(statement, i);
            const auto size = static_cast<std::size_t>(sqlite3_column_bytes(statement, i));
            row.AddValue(name, std::string(static_cast<const char *>(bytes), bytes ? size : 0));
        }
    }
    return row;
}

/// Conditions are text: anything after the statement would be run unnoticed.
bool isBlank(const char *tail, const char *end) {
    return std::all_of(tail, end, [](char c) { return c == ' ' || c == '\n' || c == '\t'; });
}

std::string selectVersion(const std::string &infoTable) {
    SelectCommand select;
    select.AddField("version");
    select.SetTable(SqliteTableHandler(infoTable, ""));
    return select.ToStr();
}

} // namespace

void SqliteDB::Close::operator()(sqlite3 *db) const {
    const NoFork noFork;
    OvraBase::CloseSqlite()(db);
}

SqliteDB::SqliteDB(const std::string &path, unsigned int busyTime, const std::string &infoTable)
    : infoTable_(infoTable) {
    const NoFork noFork;
    auto database = OvraBase::openSqlite(path, 0);
    if (!database) {
        whyClosed_ = database.error().text; // the first statement reports it
        return;
    }
    db_.reset(database->release());
    wait_ = std::make_unique<SqliteWait>(db_.get(), std::chrono::seconds(busyTime));
}

SqliteDB::SqliteDB(const std::string &path, unsigned int busyTime, const std::string &infoTable,
                   int newestSchema)
    : SqliteDB(path, busyTime, infoTable) {
    newestSchema_ = newestSchema;
}

SqliteDB::SqliteDB(SqliteDB &&) noexcept = default;
SqliteDB &SqliteDB::operator=(SqliteDB &&) noexcept = default;
SqliteDB::~SqliteDB() = default;

bool SqliteDB::fail(const std::string &what) const {
    SetErr(ERR::kFailed, what);
    return false;
}

bool SqliteDB::execute(const char *sql) const {
    return sqlite3_exec(db_.get(), sql, nullptr, nullptr, nullptr) == SQLITE_OK ||
           fail(sqlite3_errmsg(db_.get()));
}

bool SqliteDB::refuseNewerSchema() const {
    const OvraBase::SqliteStatement statement =
        OvraBase::prepareSqlite(db_.get(), selectVersion(infoTable_));
    if (!statement || sqlite3_step(statement.get()) != SQLITE_ROW ||
        sqlite3_column_int64(statement.get(), 0) <= *newestSchema_) {
        return true;
    }
    return fail("its schema " + std::to_string(sqlite3_column_int64(statement.get(), 0)) +
                " is newer than this program's " + std::to_string(*newestSchema_) +
                ": install the version that made it");
}

/// The check and the statement are one transaction, so that nobody upgrades the file in between.
bool SqliteDB::checkedRun(Access access, const std::string &sql, std::vector<SqliteValueList> *rows,
                          bool firstOnly) {
    const NoFork noFork;
    // Else a power failure might bring the journal of a change back, and undo the change.
    if (access == Access::kWrite && db_ && !sql.empty() && !execute("PRAGMA synchronous = EXTRA")) {
        return false;
    }
    if (!newestSchema_ || !db_ || sql.empty()) {
        return run(sql, rows, firstOnly);
    }
    if (!execute(access == Access::kWrite ? "BEGIN IMMEDIATE" : "BEGIN")) {
        return false;
    }
    if (refuseNewerSchema() && run(sql, rows, firstOnly) && execute("COMMIT")) {
        return true;
    }
    sqlite3_exec(db_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    return false;
}

bool SqliteDB::run(const std::string &sql, std::vector<SqliteValueList> *rows, bool firstOnly) {
    SetErr(ERR::kNone);
    if (sql.empty()) {
        return fail("the statement is incomplete, or its condition is invalid");
    }
    if (!db_) {
        return fail(whyClosed_);
    }
    if (sql.size() > INT_MAX) {
        return fail("the statement is too large");
    }
    const NoFork noFork;
    const char *tail = nullptr;
    const OvraBase::SqliteStatement statement = OvraBase::prepareSqlite(db_.get(), sql, &tail);
    if (!statement && sqlite3_errcode(db_.get()) != SQLITE_OK) {
        return fail(sqlite3_errmsg(db_.get()));
    }
    if (!statement || !isBlank(tail, sql.data() + sql.size())) {
        return fail("the condition holds more than a condition");
    }
    int result = SQLITE_OK;
    while ((result = sqlite3_step(statement.get())) == SQLITE_ROW) {
        if (rows == nullptr) {
            continue;
        }
        rows->push_back(rowOf(statement.get()));
        if (firstOnly) {
            return true;
        }
    }
    return result == SQLITE_DONE || fail(sqlite3_errmsg(db_.get()));
}

bool SqliteDB::SelectRecord(const SelectCommand &command, SqliteValueList &row) {
    std::vector<SqliteValueList> rows;
    if (!checkedRun(Access::kRead, command.ToStr(), &rows, true)) {
        return false;
    }
    row = rows.empty() ? SqliteValueList() : rows.front();
    return true;
}

bool SqliteDB::SelectRecords(const SelectCommand &command, std::vector<SqliteValueList> &rows) {
    std::vector<SqliteValueList> found;
    if (!checkedRun(Access::kRead, command.ToStr(), &found, false)) {
        return false;
    }
    rows.insert(rows.end(), found.begin(), found.end());
    return true;
}

bool SqliteDB::InsertRecord(const InsertCommand &command) {
    return checkedRun(Access::kWrite, command.ToStr(), nullptr, false);
}

bool SqliteDB::UpdateRecord(const UpdateCommand &command) {
    return checkedRun(Access::kWrite, command.ToStr(), nullptr, false);
}

bool SqliteDB::DeleteRecord(const std::string &condition, const SqliteTableHandler &table) {
    DeleteCommand command;
    command.SetTable(table);
    command.SetCondition(condition);
    return checkedRun(Access::kWrite, command.ToStr(), nullptr, false);
}

int SqliteDB::GetSchemaVersion() {
    std::vector<SqliteValueList> rows;
    int version = -1;
    if (run(selectVersion(infoTable_), &rows, true) &&
        (rows.empty() || !rows.front().GetValue("version", version))) {
        fail("it holds no schema version");
    }
    return version;
}

} // namespace OvraDRCore
