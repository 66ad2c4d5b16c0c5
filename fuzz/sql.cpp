// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovradrcore/sqlite_command.h>

#include <sqlite3.h>

#include <string>

using namespace OvraDRCore;
using OvraFuzz::require;

namespace {

sqlite3 *database() {
    static sqlite3 *const opened = [] {
        sqlite3 *db = nullptr;
        require(sqlite3_open(":memory:", &db) == SQLITE_OK, "a database in memory");
        require(sqlite3_exec(db, "CREATE TABLE t (a TEXT, b INTEGER)", nullptr, nullptr, nullptr) ==
                    SQLITE_OK,
                "a table");
        return db;
    }();
    return opened;
}

/// Runs one statement, which must be all of `sql`. \return its rows
int run(const SqliteCommand &command) {
    const std::string sql = command.ToStr();
    require(!sql.empty(), "a complete statement has a text");
    sqlite3_stmt *statement = nullptr;
    const char *rest = nullptr;
    require(sqlite3_prepare_v2(database(), sql.c_str(), static_cast<int>(sql.size() + 1),
                               &statement, &rest) == SQLITE_OK,
            "a value cannot break a statement");
    require(statement != nullptr && rest == sql.c_str() + sql.size(),
            "a value cannot end a statement or begin another one");
    int rows = 0;
    int code = SQLITE_OK;
    while ((code = sqlite3_step(statement)) == SQLITE_ROW) {
        ++rows;
    }
    require(code == SQLITE_DONE, "a statement runs");
    sqlite3_finalize(statement);
    return rows;
}

} // namespace

// Whatever a text is, it is a value and nothing else: one row goes in, only it is found and
// changed.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view input = OvraFuzz::textOf(data, size);
    const std::string text(input.substr(0, input.size() / 2));
    const std::string other(input.substr(input.size() / 2));
    sqlite3_exec(database(), "DELETE FROM t; INSERT INTO t VALUES ('keep', 1)", nullptr, nullptr,
                 nullptr);
    const SqliteTableHandler table("t", "");

    InsertCommand insert;
    insert.SetTable(table);
    insert.AddFieldValue("a", text);
    insert.AddFieldValue("b", 2);
    run(insert);

    SelectCommand select;
    select.SetTable(table);
    select.SelectAll();
    select.SetCondition(SqliteAnd(SqliteEqual("a", text), SqliteEqual("b", 2)));
    require(run(select) == 1, "what was stored is found");
    (void)select.ToLogStr();

    UpdateCommand update;
    update.SetTable(table);
    update.AddFieldValue("a", other);
    update.SetCondition(SqliteEqual("a", text).text + " AND b = 2");
    run(update);
    require(sqlite3_changes(database()) == 1, "one row is changed");

    DeleteCommand remove;
    remove.SetTable(table);
    remove.SetCondition(SqliteAnd(SqliteEqual("b", 2), SqliteEqual("a", other)).text);
    run(remove);
    require(sqlite3_changes(database()) == 1, "one row is deleted");
    SelectCommand all;
    all.SetTable(table);
    all.SelectAll();
    require(run(all) == 1, "the other row is kept");
    return 0;
}
