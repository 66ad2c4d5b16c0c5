// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovradrcore/sqlite_db.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <thread>

using namespace OvraDRCore;

namespace {

constexpr const char *kPath = "/usr/ovra/test.db";
const SqliteTableHandler kTable("t", "");

void execute(const std::string &sql) {
    sqlite3 *db = nullptr;
    ASSERT_EQ(sqlite3_open(kPath, &db), SQLITE_OK);
    char *error = nullptr;
    EXPECT_EQ(sqlite3_exec(db, sql.c_str(), nullptr, nullptr, &error), SQLITE_OK) << error;
    sqlite3_close(db);
}

SqliteDB openDb(unsigned int busyTime = 1) {
    return {kPath, busyTime, "info"};
}

/// \return why it failed; "" if it did not
std::string insert(const std::string &id, const SqliteValue &value) {
    SqliteValueList row;
    row.AddValue("id", id);
    row.AddValue("v", value);
    InsertCommand command;
    command.SetTable(kTable);
    command.SetFieldValues(row);
    SqliteDB db = openDb();
    return db.InsertRecord(command) ? "" : db.GetErrMsg().asString();
}

std::vector<SqliteValueList> select(const SqliteCondition &condition) {
    SelectCommand command;
    command.SetTable(kTable);
    command.SelectAll();
    command.SetCondition(condition);
    std::vector<SqliteValueList> rows;
    EXPECT_TRUE(openDb().SelectRecords(command, rows));
    return rows;
}

class Sqlite : public testing::Test {
protected:
    void SetUp() override { execute("CREATE TABLE t (id TEXT, v, session TEXT)"); }
    LogCapture log;
};

} // namespace

TEST_F(Sqlite, AnyBytesAreStoredAndMatchedExactly) {
    using std::string_literals::operator""s;
    const std::vector<std::string> texts = {"plain",
                                            "",
                                            "it's",
                                            "''",
                                            "a'); DROP TABLE t; --",
                                            "\"quoted\" %s \\",
                                            "nul\0inside"s,
                                            "nul\0inside'"s,
                                            "\xff\xfe not utf-8",
                                            std::string(3000000, 'x')};
    for (std::size_t i = 0; i < texts.size(); ++i) {
        ASSERT_EQ(insert(std::to_string(i), texts[i]), "") << i;
    }
    for (std::size_t i = 0; i < texts.size(); ++i) {
        const auto rows = select(SqliteEqual("v", texts[i]));
        ASSERT_EQ(rows.size(), 1U) << i;
        std::string read, id;
        EXPECT_TRUE(rows[0].GetValue("v", read) && rows[0].GetValue("id", id));
        EXPECT_TRUE(read == texts[i]) << i;
        EXPECT_EQ(id, std::to_string(i));
    }
}

TEST_F(Sqlite, KindsOfValuesReadBackAsTheyAre) {
    insert("int", -5);
    insert("text", "17");
    execute("INSERT INTO t VALUES ('null', NULL, NULL), ('float', 1.5, NULL), ('wide', 1e12, NULL),"
            "('big', 9999999999, NULL)");
    const auto value = [](const char *id) { return select(SqliteEqual("id", id)).at(0); };
    for (const auto &[id, expected] : {std::pair("int", -5), {"text", 17}}) {
        int number = 0;
        EXPECT_TRUE(value(id).GetValue("v", number));
        EXPECT_EQ(number, expected);
    }
    std::string text = "unset";
    EXPECT_TRUE(value("int").GetValue("v", text));
    EXPECT_EQ(text, "-5");
    EXPECT_FALSE(value("int").GetValue("v").GetValue(text)) << "it does not hold text";
    EXPECT_FALSE(value("int").GetValue("absent").GetValue(text));
    int number = 99;
    for (const char *id : {"null", "float", "wide", "big"}) {
        EXPECT_FALSE(value(id).GetValue("v", number)) << id;
    }
    EXPECT_FALSE(value("int").GetValue("absent", number));
    EXPECT_EQ(number, 99) << "a failed read leaves the target";
}

TEST_F(Sqlite, ASelectionGivesTheColumnsAskedForAndMayFindNothing) {
    insert("a", 1);
    SelectCommand command;
    command.SetTable(kTable);
    command.AddField("id");
    SqliteValueList row;
    EXPECT_TRUE(openDb().SelectRecord(command, row));
    EXPECT_EQ(row.size(), 1U);
    command.SetCondition(SqliteAnd(SqliteEqual("id", "a"), SqliteEqual("v", 2)));
    EXPECT_TRUE(openDb().SelectRecord(command, row));
    EXPECT_TRUE(row.empty());
}

TEST_F(Sqlite, AConditionThatSaysNothingNeverMeansEveryRow) {
    struct Doubtful : SqliteCondition {
        Doubtful()
            : SqliteCondition("1 = 1") {}
        bool IsValid() const override { return false; }
    };
    insert("a", 1);
    const auto refused = [](const auto &set) {
        SelectCommand select;
        select.SetTable(kTable);
        select.SelectAll();
        set(select);
        UpdateCommand update;
        update.SetTable(kTable);
        update.AddFieldValue("v", 9);
        set(update);
        std::vector<SqliteValueList> rows;
        return !openDb().SelectRecords(select, rows) && !openDb().UpdateRecord(update);
    };
    EXPECT_TRUE(refused([](auto &command) { command.SetCondition(Doubtful()); }));
    for (const std::string &text :
         {std::string(), SqliteAnd(SqliteEqual("", "x"), SqliteEqual("v", 1)).text,
          SqliteAnd(Doubtful(), SqliteEqual("v", 1)).text, std::string("1 = 1; DELETE FROM t"),
          std::string("\"idd\" = 'a'")}) {
        EXPECT_TRUE(refused([&](auto &command) { command.SetCondition(text); })) << text;
        EXPECT_FALSE(openDb().DeleteRecord(text, kTable)) << text;
    }
    EXPECT_EQ(select(SqliteEqual("v", 1)).size(), 1U);
    InsertCommand noTable, noValue;
    noTable.AddFieldValue("id", "a");
    noValue.SetTable(kTable);
    EXPECT_FALSE(openDb().InsertRecord(noTable) || openDb().InsertRecord(noValue));
    EXPECT_EQ(log.lines().size(), 0U) << "whether a failure matters is the caller's to say";
}

TEST_F(Sqlite, TheLoggedStatementHidesTheSession) {
    InsertCommand command;
    command.SetTable(kTable);
    command.AddFieldValue("id", "a");
    command.AddFieldValue("session", "secret");
    EXPECT_EQ(command.ToStr(), R"(INSERT INTO "t" ("id", "session") VALUES ('a', 'secret'))");
    EXPECT_EQ(command.ToLogStr(), R"(INSERT INTO "t" ("id", "session") VALUES ('a', '***'))");
}

TEST_F(Sqlite, WaitsForALockOfAnotherAndFailsWhenItStays) {
    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(kPath, &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    EXPECT_EQ(insert("a", 1), "database is locked");
    std::thread release([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    });
    EXPECT_EQ(insert("a", 1), "");
    release.join();
    sqlite3_close(other);
}

TEST_F(Sqlite, AFileThatIsNotWhatItShouldBeFailsClearlyAndIsLeftAlone) {
    insert("a", 1);
    unlink(kPath);
    EXPECT_NE(insert("b", 1), "");
    EXPECT_NE(access(kPath, F_OK), 0) << "an absent file is not made";
    std::ofstream(kPath).close();
    EXPECT_NE(insert("b", 1), "") << "an empty file has no table";
    std::ofstream(kPath) << std::string(10000, '?');
    EXPECT_EQ(insert("a", 1), "file is not a database");
    struct stat status {};
    stat(kPath, &status);
    EXPECT_EQ(status.st_size, 10000);
}

TEST_F(Sqlite, TheSchemaVersionIsThatOfProvisioning) {
    SqliteDB db = openDb();
    EXPECT_EQ(db.GetSchemaVersion(), -1);
    EXPECT_EQ(db.GetErrMsg().asString(), "no such table: info");
    execute("CREATE TABLE info (version INTEGER)");
    EXPECT_EQ(db.GetSchemaVersion(), -1);
    EXPECT_EQ(db.GetErrMsg().asString(), "it holds no schema version");
    execute("INSERT INTO info VALUES (3)");
    EXPECT_EQ(db.GetSchemaVersion(), 3);
    ASSERT_EQ(insert("a", 1), "");
    for (const int known : {2, 3}) {
        SqliteDB checked(kPath, 1, "info", known);
        std::vector<SqliteValueList> rows;
        EXPECT_EQ(checked.DeleteRecord("id = 'b'", SqliteTableHandler("t", "")), known == 3);
        EXPECT_EQ(checked.GetErrMsg().asString().find("its schema 3 is newer") == 0, known == 2);
        EXPECT_EQ(checked.GetSchemaVersion(), 3);
    }
}
