// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <tl/expected.hpp>

#include <memory>
#include <string>

struct sqlite3;
struct sqlite3_stmt;

// SQLite handles. Callers decide what an error means and how long to wait for a lock.
namespace OvraBase {

struct CloseSqlite {
    void operator()(sqlite3 *database) const;
};
struct FinalizeSqlite {
    void operator()(sqlite3_stmt *statement) const;
};

/// A connection, for one thread at a time.
using SqliteHandle = std::unique_ptr<sqlite3, CloseSqlite>;
/// A prepared statement; its connection must outlive it.
using SqliteStatement = std::unique_ptr<sqlite3_stmt, FinalizeSqlite>;

/// Why a file cannot be used.
struct SqliteFailure {
    int code; ///< SQLite's
    std::string text;
};

/// Opens an existing file for reading and writing, with extended result codes. It is judged first
/// (judgeFile()), and so is what SQLite opens beside it: SQLite follows links and waits for the
/// other end of a FIFO. Untrusted SQL in the file's schema is not run, and a misspelt column is an
/// error, not a text.
/// \param busyMilliseconds  how long to wait for a lock that another connection holds
tl::expected<SqliteHandle, SqliteFailure> openSqlite(const std::string &path, int busyMilliseconds);

/// Prepares the first statement of `sql`; null on failure, and sqliteText() says why.
/// \param tail  receives the rest of `sql`; may be null
SqliteStatement prepareSqlite(sqlite3 *database, const std::string &sql,
                              const char **tail = nullptr);

/// SQLite's text for the connection's last failure.
/// \param code  the error code, used if there is no connection
std::string sqliteText(sqlite3 *database, int code);

} // namespace OvraBase
