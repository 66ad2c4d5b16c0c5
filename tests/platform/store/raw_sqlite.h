// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/sqlite.h>

#include <sqlite3.h>

#include <string>

namespace OvraTest {

/// The test's own connection, besides that of the tested store.
class RawSqlite {
public:
    explicit RawSqlite(const std::string &path) {
        sqlite3 *raw = nullptr;
        sqlite3_open(path.c_str(), &raw);
        sqlite3_busy_timeout(raw, 10'000);
        database_.reset(raw);
    }

    bool run(const std::string &sql) {
        return sqlite3_exec(database_.get(), sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK;
    }
    /// The first cell of the first row, as text.
    std::string cell(const std::string &sql) {
        std::string text = "(nothing)";
        sqlite3_exec(
            database_.get(), sql.c_str(),
            [](void *target, int /*columns*/, char **values, char ** /*names*/) {
                *static_cast<std::string *>(target) = values[0] != nullptr ? values[0] : "(null)";
                return 0;
            },
            &text, nullptr);
        return text;
    }

private:
    OvraBase::SqliteHandle database_;
};

} // namespace OvraTest
