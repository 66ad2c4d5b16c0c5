// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/sqlite.h"

#include "ovrabase/file.h"

#include <sqlite3.h>

#include <cerrno>

namespace OvraBase {

namespace {

/// What is not there is left to SQLite.
tl::expected<void, SqliteFailure> judge(const std::string &path) {
    for (const char *suffix : {"", "-journal", "-wal", "-shm"}) {
        struct stat status {};
        const std::string file = path + suffix;
        if (lstat(file.c_str(), &status) != 0) {
            continue;
        }
        if (S_ISLNK(status.st_mode)) {
            return tl::unexpected(
                SqliteFailure{SQLITE_CANTOPEN, file + " is a symbolic link: put the file there"});
        }
        if (const auto judged = judgeFile(file, status); !judged) {
            return tl::unexpected(
                SqliteFailure{SQLITE_CANTOPEN, file + ": " + judged.error().text});
        }
    }
    return {};
}

} // namespace

void CloseSqlite::operator()(sqlite3 *database) const {
    sqlite3_close_v2(database);
}

void FinalizeSqlite::operator()(sqlite3_stmt *statement) const {
    sqlite3_finalize(statement);
}

tl::expected<SqliteHandle, SqliteFailure> openSqlite(const std::string &path,
                                                     int busyMilliseconds) {
    if (auto judged = judge(path); !judged) {
        return tl::unexpected(std::move(judged.error()));
    }
    sqlite3 *opened = nullptr;
    // NOMUTEX: a connection serves one thread.
    const int result = sqlite3_open_v2(
        path.c_str(), &opened, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE,
        nullptr);
    SqliteHandle database(opened);
    if (result != SQLITE_OK) {
        return tl::unexpected(SqliteFailure{result, sqliteText(opened, result)});
    }
    sqlite3_busy_timeout(opened, busyMilliseconds);
    sqlite3_db_config(opened, SQLITE_DBCONFIG_DQS_DML, 0, nullptr);
    sqlite3_db_config(opened, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
    return database;
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
