// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/err_recorder.h"
#include "ovradrcore/export.h"
#include "ovradrcore/no_fork.h"
#include "ovradrcore/sqlite_command.h"
#include "ovradrcore/sqlite_value.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

struct sqlite3;

namespace OvraDRCore {

/// An open SQLite file. Construction reports no error: if the file cannot be opened, every
/// operation fails. Neither the file nor a table is ever created here.
///
/// Every operation returns false on failure and records 407 with SQLite's error text as the
/// message; it logs nothing, because the caller knows whether a failure matters. Nothing throws.
/// Operations wait for a file locked by another process. An object is for one thread at a time, and
/// a forked child does not use that of its parent.
class OVRADRCORE_EXPORT SqliteDB : public ErrRecorder {
public:
    /// \param path       the database file
    /// \param busyTime   seconds to wait for a lock that another process holds
    /// \param infoTable  the table in which provisioning keeps the schema version
    SqliteDB(const std::string &path, unsigned int busyTime, const std::string &infoTable);
    /// \param newestSchema  a file with a newer schema than this is neither read nor changed: every
    ///                      operation fails. One without a schema version is used as it is.
    SqliteDB(const std::string &path, unsigned int busyTime, const std::string &infoTable,
             int newestSchema);
    SqliteDB(SqliteDB &&) noexcept;
    SqliteDB &operator=(SqliteDB &&) noexcept;
    ~SqliteDB() override;

    /// The first row of the result, or an empty list if there is none.
    [[nodiscard]] bool SelectRecord(const SelectCommand &command, SqliteValueList &row);
    /// Appends one list per row, in SQLite's order.
    [[nodiscard]] bool SelectRecords(const SelectCommand &command,
                                     std::vector<SqliteValueList> &rows);
    [[nodiscard]] bool InsertRecord(const InsertCommand &command);
    /// Success does not depend on how many rows changed.
    [[nodiscard]] bool UpdateRecord(const UpdateCommand &command);
    /// An empty condition is rejected: a delete never affects every row.
    [[nodiscard]] bool DeleteRecord(const std::string &condition, const SqliteTableHandler &table);

    /// The schema version that provisioning wrote into the info table; -1 if it cannot be read,
    /// and GetErrMsg() says why.
    [[nodiscard]] int GetSchemaVersion();

private:
    struct Close {
        void operator()(sqlite3 *db) const;
    };

    enum class Access { kRead, kWrite };
    bool checkedRun(Access access, const std::string &sql, std::vector<SqliteValueList> *rows,
                    bool firstOnly);
    bool run(const std::string &sql, std::vector<SqliteValueList> *rows, bool firstOnly);
    bool refuseNewerSchema() const;
    bool execute(const char *sql) const;
    bool fail(const std::string &what) const;

    std::string infoTable_;
    std::optional<int> newestSchema_;
    std::string whyClosed_;
    std::unique_ptr<SqliteWait> wait_;
    std::unique_ptr<sqlite3, Close> db_;
};

} // namespace OvraDRCore
