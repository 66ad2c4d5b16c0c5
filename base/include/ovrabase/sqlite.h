// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <memory>
#include <string>

struct sqlite3;
struct sqlite3_stmt;

// SQLite's handles. What an error means and how long a lock is waited for is decided by those who
// use them.
namespace OvraBase {

struct CloseSqlite {
    void operator()(sqlite3 *database) const;
};
struct FinalizeSqlite {
    void operator()(sqlite3_stmt *statement) const;
};

/// A connection, for one thread at a time.
using SqliteHandle = std::unique_ptr<sqlite3, CloseSqlite>;
/// A prepared statement; it has to go before its connection is used up.
using SqliteStatement = std::unique_ptr<sqlite3_stmt, FinalizeSqlite>;

/// Opens an existing file for reading and writing, with extended result codes. SQL that a stranger
/// may have left in the file's schema is not run, and a misspelt column is an error, not a text.
/// \param busyMilliseconds  how long to wait for a lock that another connection holds
/// \param database          set also on failure, for its message, unless memory is short
/// \return SQLITE_OK, or why the file cannot be used.
int openSqlite(const std::string &path, int busyMilliseconds, SqliteHandle &database);

/// Prepares the first statement of `sql`; null when that is not possible, and sqliteText() says
/// why. \param tail  takes what follows the statement; may be null
SqliteStatement prepareSqlite(sqlite3 *database, const std::string &sql,
                              const char **tail = nullptr);

/// SQLite's words for the connection's last failure.
/// \param code  the failure, for when there is no connection
std::string sqliteText(sqlite3 *database, int code);

} // namespace OvraBase
