// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <ovradrcore/no_fork.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

struct sqlite3;
struct sqlite3_stmt;

namespace OvraPlatform {

/// The path of a database without a file, gone with its connection.
inline constexpr char kInMemory[] = ":memory:";

/// What kind of file a store has.
struct DatabaseLayout {
    const char *name;   ///< as named in messages, e.g. "session store"
    int applicationId;  ///< SQLite's application_id: another program's file is refused
    int version;        ///< SQLite's user_version: a newer program's file is refused
    const char *schema; ///< creates the tables in a new file; with `upgrade`, as they were before
    /// Turns the tables of the version before into these, when such a file is opened; null: it is
    /// refused.
    const char *upgrade = nullptr;
};

/// A prepared statement. Text and blobs are bound, never pasted. Short-lived: while it exists, it
/// may hold a lock of the file, and forks wait.
class OVRAPLATFORM_EXPORT Statement {
public:
    Statement &bind(int index, std::string_view text);
    Statement &bind(int index, std::int64_t number);
    Statement &bindBlob(int index, std::string_view bytes);
    /// Binds NULL for an absent text.
    Statement &bindOptional(int index, std::string_view text);

    /// \return true if there is a row; false at the end and on failure (Database::failed()).
    [[nodiscard]] bool step();
    /// Runs a statement that returns no row; false on failure.
    [[nodiscard]] bool run();

    std::string text(int column) const; ///< NULL reads as ""
    std::int64_t number(int column) const;
    bool isNull(int column) const;

private:
    friend class Database;
    struct Finalize {
        void operator()(sqlite3_stmt *statement) const;
    };

    /// What was not bound would be NULL: such a statement does not run.
    [[nodiscard]] bool isBound();
    Statement &noteBound(int code);

    Statement(class Database *database, sqlite3_stmt *statement)
        : database_(database)
        , statement_(statement) {}

    OvraDRCore::NoFork noFork_;
    class Database *database_;
    int bound_ = 0; ///< SQLite's code for the first value that could not be bound
    std::unique_ptr<sqlite3_stmt, Finalize> statement_;
};

/// One connection to a store's SQLite file. Not shared between threads, nor kept across a fork. If
/// the file could not be opened, every operation fails harmlessly. A failure is kept as one
/// sentence that says what was wrong and what to do, and is logged once at ERR. The stores built on
/// it report errors the same way, with false and error(), as SQLite does: a statement of several
/// steps and a transaction of several statements have one failure, which belongs to the connection.
class OVRAPLATFORM_EXPORT Database {
public:
    /// Opens the file; creates it, mode 0600, and its folder (ensureStateDir()) if missing.
    /// \param path  or kInMemory
    Database(std::string path, const DatabaseLayout &layout);
    Database(const Database &) = delete;
    Database &operator=(const Database &) = delete;

    bool isOpen() const { return database_ != nullptr; }
    /// Whether anything failed since the last clearError().
    bool failed() const { return !error_.empty(); }
    const std::string &error() const { return error_; }
    void clearError() { error_.clear(); }
    /// Records a failure and logs it at ERR. Always returns false.
    bool fail(const std::string &sentence);
    /// Records why the store refuses a request; the caller reports it. Always returns false.
    bool refuse(const std::string &sentence);

    Statement prepare(const char *sql);
    [[nodiscard]] bool execute(const char *sql);
    /// Rows changed by the last statement.
    int changes() const;

private:
    friend class Statement;
    friend class Transaction;
    struct Close {
        void operator()(sqlite3 *database) const;
    };

    [[nodiscard]] bool makeFile();
    [[nodiscard]] bool setUp();
    bool isPrevious(std::optional<std::int64_t> version) const;
    [[nodiscard]] bool makeTables();
    bool failSqlite(int code);
    bool failSqlite(int code, const std::string &text);
    void rollback();
    std::optional<std::int64_t> pragma(const char *sql);

    std::string path_;
    DatabaseLayout layout_;
    std::unique_ptr<OvraDRCore::SqliteWait> wait_;
    std::unique_ptr<sqlite3, Close> database_;
    std::string error_;
};

/// A write transaction: nothing is written without commit(). Short-lived: forks wait for its end.
class OVRAPLATFORM_EXPORT Transaction {
public:
    /// Waits for another process's transaction up to the connection's busy time-out.
    explicit Transaction(Database &database);
    Transaction(const Transaction &) = delete;
    Transaction &operator=(const Transaction &) = delete;
    ~Transaction();

    bool isOpen() const { return open_; }
    [[nodiscard]] bool commit();

private:
    OvraDRCore::NoFork noFork_;
    Database &database_;
    bool open_;
};

} // namespace OvraPlatform
