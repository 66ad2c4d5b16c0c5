// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/sqlite.h"

#include <sqlite3.h>

namespace OvraBase {

void CloseSqlite::operator()(sqlite3 *database) const {
    sqlite3_close_v2(database);
}

void FinalizeSqlite::operator()(sqlite3_stmt *statement) const {
    sqlite3_finalize(statement);
}

int openSqlite(const std::string &path, int busyMilliseconds, SqliteHandle &database) {
    sqlite3 *opened = nullptr;
    // NOMUTEX: a connection serves one thread.
    const int result = sqlite3_open_v2(
        path.c_str(), &opened, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE,
        nullptr);
    database.reset(opened);
    if (result == SQLITE_OK) {
        sqlite3_busy_timeout(opened, busyMilliseconds);
        sqlite3_db_config(opened, SQLITE_DBCONFIG_DQS_DML, 0, nullptr);
        sqlite3_db_config(opened, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
    }
    return result;
}

SqliteStatement prepareSqlite(sqlite3 *database, const std::string &sql, const char **tail) {
    sqlite3_stmt *prepared = nullptr;
    sqlite3_prepare_v2(database, sql.data(), static_cast<int>(sql.size()), &prepared, tail);
    return SqliteStatement(prepared);
}

std::string sqliteText(sqlite3 *database, int code) {
    return database != nullptr ? sqlite3_errmsg(database) : sqlite3_errstr(code);
}

} // namespace OvraBase
