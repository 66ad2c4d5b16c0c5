// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "platform/store/raw_sqlite.h"

#include <ovraplatform/session_store.h>

#include <sqlite3.h>

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <thread>
#include <vector>

using namespace OvraPlatform;
using namespace OvraTest;

namespace {

struct Sessions : OwnFiles {
    std::string file() const { return path("state/sessions.db"); }
    SessionStore store() {
        return SessionStore(file(), [this] { return time; });
    }
    std::string create(const std::string &user, int timeout, const std::string &app = "") {
        return store().create({user, app, "", "", "", timeout, true}).value_or("");
    }
    std::size_t count() {
        std::vector<SessionRecord> sessions;
        return store().list(sessions) ? sessions.size() : 9999;
    }

    /// Adds sessions that never end, each with data of its own.
    void addMany(const char *user, int number) {
        ASSERT_TRUE(RawSqlite(file()).run(
            "WITH RECURSIVE n(i) AS (VALUES (1) UNION ALL SELECT i + 1 FROM n WHERE i < " +
            std::to_string(number) +
            ") INSERT INTO session (key, id, user, app, extra, created) SELECT randomblob(32), i, "
            "'" +
            user + "', 'Tidewater', i, 1 FROM n"));
    }

    std::time_t time = 1'700'000'000;
};

constexpr char kLayoutText[] =
    "SELECT group_concat(name) FROM (SELECT name FROM sqlite_schema ORDER BY name)";

TEST_F(Sessions, KeepWhatTheyWereMadeOfAndAreFoundByTheWholeIdOnly) {
    const SessionRequest request = {
        "ann", "Tidewater", R"({"node_id":"n1"})", R"({"hide":true})", "::ffff:192.0.2.1",
        60,    true};
    const std::optional<std::string> id = store().create(request);
    ASSERT_TRUE(id);
    EXPECT_EQ(id->size(), 43U);
    EXPECT_EQ(
        id->find_first_not_of("abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-_"),
        std::string::npos);
    const std::optional<SessionRecord> found = store().find(*id);
    ASSERT_TRUE(found);
    EXPECT_EQ(found->id + found->user + found->app + found->extra + found->ui + found->remote,
              *id + request.user + request.app + request.extra + request.ui + request.remote);
    EXPECT_EQ(found->created, time);
    EXPECT_EQ(found->expires, time + 60);
    EXPECT_EQ(found->toString().find(*id), std::string::npos);
    EXPECT_NE(found->toString().find(found->reference()), std::string::npos);
    std::string altered = *id;
    altered[20] = altered[20] == 'A' ? 'B' : 'A';
    for (const std::string &other : {std::string(), altered, *id + "=", id->substr(0, 42),
                                     std::string("%"), std::string(43, '\0')}) {
        EXPECT_FALSE(store().find(other)) << other;
    }
    EXPECT_NE(*id, create("ann", -1));
}

TEST_F(Sessions, EndAtTheirTimeAndAreThenSwept) {
    const std::string timed = create("ann", 10);
    const std::string lasting = create("ann", -1);
    time -= 60; // a clock that is set back by more than that ends them
    EXPECT_TRUE(store().find(timed));
    time -= 1;
    EXPECT_FALSE(store().find(timed));
    EXPECT_TRUE(store().find(lasting));
    time += 70;
    EXPECT_TRUE(store().find(timed));
    time += 1;
    EXPECT_FALSE(store().find(timed));
    EXPECT_EQ(count(), 1U);
    bool walked = false;
    EXPECT_TRUE(store().removeIf([&](const SessionRecord &session) {
        walked = walked || session.id == timed;
        return false;
    }));
    EXPECT_FALSE(walked);
    EXPECT_EQ(RawSqlite(file()).cell("SELECT count(*) FROM session"), "2");
    create("bob", 10);
    EXPECT_EQ(RawSqlite(file()).cell("SELECT count(*) FROM session"), "2");
    time += 1'000'000'000;
    EXPECT_TRUE(store().sweep());
    EXPECT_EQ(RawSqlite(file()).cell("SELECT count(*) FROM session"), "1");
    EXPECT_TRUE(store().find(lasting));
}

TEST_F(Sessions, ANewOneEndsTheUsersOthersOfItsApplicationUnlessTheyAreToStay) {
    const std::string first = create("ann", -1, "web");
    const std::string second = create("ann", -1, "web");
    const std::string otherApp = create("ann", -1, "Tidewater");
    const std::string noApp = create("ann", -1);
    const std::string otherUser = create("bob", -1, "web");
    const std::string alone = store().create({.user = "ann", .app = "web"}).value_or("");
    EXPECT_FALSE(store().find(first));
    EXPECT_FALSE(store().find(second));
    for (const std::string &id : {alone, otherApp, noApp, otherUser}) {
        EXPECT_TRUE(store().find(id));
    }
    ASSERT_TRUE(store().create({.user = "ann"}));
    EXPECT_FALSE(store().find(noApp));
    EXPECT_TRUE(store().find(alone));
}

TEST_F(Sessions, AreLimitedWhereTheyEndAndInAll) {
    SessionStore sessions = store();
    const SessionRequest timed = {"ann", "", "", "", "", 100, true};
    for (int i = 0; i < 512; ++i) {
        ASSERT_TRUE(sessions.create(timed));
    }
    EXPECT_FALSE(sessions.create(timed));
    EXPECT_NE(sessions.error().find("User [ann] has 512 sessions"), std::string::npos);
    EXPECT_NE(create("bob", 100), "");
    EXPECT_NE(create("ann", -1), "");
    time += 100;
    EXPECT_TRUE(sessions.create(timed)); // removes the expired ones
    EXPECT_EQ(sessions.error(), "");
    addMany("ann", 65'534);
    EXPECT_FALSE(sessions.create({"bob", "", "", "", "", -1, true}));
    EXPECT_NE(sessions.error().find("65536 sessions"), std::string::npos);
    EXPECT_EQ(count(), 65'536U);
}

/// SQLite's instructions for one operation: its cost, whatever else the machine does.
std::uint64_t stepsOf(const std::function<void()> &operation) {
    static std::uint64_t steps = 0;
    steps = 0;
    sqlite3_auto_extension(reinterpret_cast<void (*)()>(
        +[](sqlite3 *database, char ** /*error*/, const void * /*api*/) {
            sqlite3_progress_handler(
                database, 1,
                [](void * /*unused*/) {
                    ++steps;
                    return 0;
                },
                nullptr);
            return SQLITE_OK;
        }));
    operation();
    sqlite3_reset_auto_extension();
    return steps;
}

TEST_F(Sessions, CostNoMoreAmongTenThousandOfTheirUser) {
    const SessionRequest request = {"ann", "Tidewater", R"({"node_id":"n1"})", "", "", -1, true};
    const SessionFilter filter = {request.user, request.app, request.extra};
    const auto oneMore = [&] {
        int visited = 0;
        const auto visit = [&](const SessionRecord &session) {
            ++visited;
            EXPECT_EQ(session.extra, request.extra);
            return false;
        };
        EXPECT_TRUE(store().removeIf(visit, &filter));
        EXPECT_TRUE(store().create(request));
        EXPECT_TRUE(store().removeIf(visit, &filter));
        EXPECT_EQ(visited, 1);
        EXPECT_TRUE(store().removeIf([](const SessionRecord &) { return true; }, &filter));
    };
    oneMore();
    const std::uint64_t alone = stepsOf(oneMore);
    addMany("ann", 10'000);
    EXPECT_LT(stepsOf(oneMore), 2 * alone);
    std::size_t visited = 0;
    EXPECT_TRUE(store().removeIf([&](const SessionRecord &) { return ++visited % 2 == 0; }));
    EXPECT_EQ(visited, 10'000U);
    EXPECT_EQ(count(), 5000U);
}

TEST_F(Sessions, OfTheFirstLayoutAreUpgradedWhole) {
    constexpr char kFirstLayout[] = R"(
        CREATE TABLE session (key BLOB PRIMARY KEY, id TEXT NOT NULL, user TEXT NOT NULL, app TEXT,
            extra TEXT, ui TEXT, remote TEXT, created INTEGER NOT NULL, expires INTEGER)
            STRICT, WITHOUT ROWID;
        CREATE INDEX session_user ON session (user);
        CREATE INDEX session_expires ON session (expires) WHERE expires IS NOT NULL;
        PRAGMA application_id = 0x4F765365; PRAGMA user_version = 1;)";
    const std::string id = create("ann", -1);
    const std::string row = RawSqlite(file()).cell("SELECT quote(key) FROM session");
    const std::string layout = RawSqlite(file()).cell(kLayoutText);
    std::filesystem::remove(file());
    ASSERT_TRUE(RawSqlite(file()).run(kFirstLayout + ("INSERT INTO session VALUES (" + row + ",'" +
                                                      id + "','ann',NULL,NULL,NULL,NULL,1,NULL)")));
    chmod(file().c_str(), 0600);
    addMany("bob", 4000);
    const std::string before = readFile(file());
    for (int wait = 0; wait < 25; ++wait) {
        writeFile(file(), before);
        OtherProcess opening([&] { return store().isOpen() ? 0 : 1; });
        std::this_thread::sleep_for(std::chrono::milliseconds(wait));
        opening.end(SIGKILL);
        ASSERT_TRUE(store().find(id));
        ASSERT_EQ(RawSqlite(file()).cell(kLayoutText), layout);
        ASSERT_EQ(RawSqlite(file()).cell("SELECT sessions FROM tally"), "4001");
    }
}

TEST_F(Sessions, OfUnusableThingsAreRefused) {
    const SessionRequest requests[] = {
        {"", "", "", "", "", -1, true},
        {std::string(492, 'u'), "", "", "", "", -1, true},
        {"ann", "", "", "", "", 0, true},
        {"ann", std::string(256, 'a'), "", "", "", -1, true},
        {"ann", "", "[1]", "", "", -1, true},
        {"ann", "", "{\"a\":", "", "", -1, true},
        {"ann", "", "", "{\"a\":\"" + std::string(4096, 'x') + "\"}", "", -1, true},
        {"ann", "", "", "", "192.0.2.1\nforged line", -1, true},
    };
    for (const SessionRequest &request : requests) {
        SessionStore sessions = store();
        EXPECT_FALSE(sessions.create(request)) << request.user;
        EXPECT_NE(sessions.error(), "");
    }
    EXPECT_EQ(count(), 0U);
    EXPECT_NE(create(std::string(491, 'u'), -1), "");
    EXPECT_NE(create("a'; DROP TABLE session; --\xFF", -1), "");
    EXPECT_EQ(count(), 2U);
}

TEST_F(Sessions, AreForTheirOwnerOnlyAndGoneFromTheFileWhenRemoved) {
    umask(0);
    const std::string gone = create("ann", -1);
    const std::string kept = create("ann", -1);
    EXPECT_NE(readFile(file()).find(gone), std::string::npos);
    EXPECT_TRUE(store().remove(gone));
    EXPECT_TRUE(store().remove(gone));
    EXPECT_FALSE(store().find(gone));
    EXPECT_TRUE(store().find(kept));
    EXPECT_EQ(readFile(file()).find(gone), std::string::npos);
    EXPECT_EQ(modeOf(path("state")), 0700U);
    EXPECT_EQ(modeOf(file()), 0600U);
    chmod(file().c_str(), 0644);
    EXPECT_EQ(count(), 1U);
    EXPECT_EQ(modeOf(file()), 0600U);
    std::filesystem::rename(file(), path("state/elsewhere"));
    std::filesystem::create_symlink("elsewhere", file());
    EXPECT_FALSE(store().isOpen());
}

TEST_F(Sessions, ADamagedOrForeignFileIsAClearErrorAndStaysAsItIs) {
    const std::string id = create("ann", -1);
    const std::string good = readFile(file());
    std::string torn = good;
    torn.replace(100, torn.size() - 100, torn.size() - 100, '\x5A');
    RawSqlite(path("foreign")).run("CREATE TABLE session (mine)");
    RawSqlite(path("foreign.v1")).run("CREATE TABLE session (mine); PRAGMA user_version = 1");
    std::filesystem::copy(file(), path("newer"));
    RawSqlite(path("newer")).run("PRAGMA user_version = 3");
    const std::string contents[] = {
        std::string(5000, 'x'),    good.substr(0, 5000),         torn,
        readFile(path("foreign")), readFile(path("foreign.v1")), readFile(path("newer"))};
    for (const std::string &content : contents) {
        writeFile(file(), content);
        SessionStore sessions = store();
        std::vector<SessionRecord> listed;
        EXPECT_FALSE(sessions.find(id));
        EXPECT_FALSE(sessions.list(listed));
        EXPECT_FALSE(sessions.create({"ann", "", "", "", "", -1, true}));
        EXPECT_FALSE(sessions.removeIf([](const SessionRecord &) { return true; }));
        EXPECT_NE(sessions.error().find(file()), std::string::npos) << sessions.error();
        EXPECT_NE(sessions.error().find("move"), std::string::npos) << sessions.error();
        EXPECT_EQ(readFile(file()), content);
    }
}

TEST_F(Sessions, ManyProcessesMakeTheStoreAndUseItAtOnce) {
    const auto makeTen = [&] {
        int made = 0;
        for (int i = 0; i < 10; ++i) {
            made += create("ann", -1).empty() ? 0 : 1;
        }
        return made;
    };
    OtherProcess processes[] = {OtherProcess(makeTen), OtherProcess(makeTen), OtherProcess(makeTen),
                                OtherProcess(makeTen)};
    for (OtherProcess &process : processes) {
        EXPECT_EQ(process.wait(), 10);
    }
    EXPECT_EQ(count(), 40U);
}

TEST_F(Sessions, ThatWereHandedOutOutliveAKilledProcess) {
    for (int round = 0; round < 8; ++round) {
        const std::string handedOut = path("ids" + std::to_string(round));
        writeFile(handedOut, "");
        OtherProcess maker([&] {
            std::ofstream ids(handedOut);
            while (true) {
                ids << create("user" + std::to_string(round), -1) << std::endl;
            }
            return 0;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(15 + 7 * round));
        maker.end(SIGKILL);
        std::ifstream ids(handedOut);
        for (std::string id; std::getline(ids, id) && !ids.eof();) {
            EXPECT_TRUE(store().find(id)) << id;
        }
    }
    EXPECT_GT(count(), 0U);
    EXPECT_EQ(RawSqlite(file()).cell("PRAGMA integrity_check"), "ok");
}

TEST_F(Sessions, AFullDiskIsAClearErrorAndLosesNothing) {
    const std::string id = create("ann", -1);
    OtherProcess full([&] {
        limitFileSize(std::filesystem::file_size(file()));
        SessionStore sessions = store();
        int made = 0;
        while (made < 500 && sessions.create({"ann", "", "", "", "", -1, true})) {
            ++made;
        }
        return sessions.error().find("disk") != std::string::npos ? 0 : 1;
    });
    EXPECT_EQ(full.wait(), 0);
    EXPECT_TRUE(store().find(id));
    EXPECT_NE(create("bob", -1), "");
}

} // namespace
