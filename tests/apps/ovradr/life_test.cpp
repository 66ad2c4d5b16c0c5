// SPDX-License-Identifier: Apache-2.0
// The fate of rows and sessions when a credential is changed or deleted, completely or partly.
#include "platform/store/raw_sqlite.h"
#include "scripted_node.h"
#include "shared/pending_releases.h"
#include "shared/session_lock.h"
#include "shared/session_release.h"

#include <ovradrcore/json.h>
#include <ovraplatform/farlink.h>

#include <atomic>
#include <csignal>
#include <set>
#include <thread>
#include <tuple>

namespace OvradrTest {

namespace {

using OvraApps::PendingRelease;
using OvraApps::PendingReleases;
using OvraTest::addCred;
using OvraTest::executeSql;
using OvraTest::querySql;

/// A credential "c1" with the session "old"; the remote deletes sessions on request.
class Life : public ScriptedNode {
protected:
    Life() {
        remote.trust();
        begin();
    }

    void begin() {
        std::filesystem::remove(OvraApps::kPendingReleasesFile);
        ended.clear();
        executeSql("DELETE FROM node_cred");
        addCred("node_cred", "n1", "c1", "https", remote.port(), "old");
        remote.forgetAnswers();
        admitBob(remote);
        remote.answer("lookup", success(R"({"port":)" + std::to_string(remote.port()) + "}"));
        for (const char *method :
             {"probe", "login", "info", "create", "test_privilege", "logout", "delete"}) {
            remote.before(method, [this, method] { called(method); });
        }
    }

    /// Kills the program at its intended last call, before the answer.
    void called(const std::string &method) {
        if (method == "delete") {
            Json::Value params;
            EXPECT_TRUE(OvraDRCore::fromString(params, remote.params("delete")));
            ended.insert(params["session"].asString());
            remote.answer(params["session"].asString() + " test_privilege", refusal(119));
        }
        if (++calls == fatal) {
            while (victim == 0) {
            }
            kill(victim, SIGKILL);
        }
    }

    /// Runs the program until the remote gets the call with that number; 0: to its end.
    void runUntil(const Arguments &arguments, int call) {
        victim = 0;
        calls = 0;
        fatal = call;
        Program program(arguments, "secret word\n");
        victim = program.pid();
        program.finish();
        fatal = 0;
    }

    static std::string sessions() {
        return querySql("SELECT session FROM node_cred ORDER BY session DESC");
    }
    static std::vector<PendingRelease> pending() {
        std::vector<PendingRelease> releases;
        EXPECT_TRUE(PendingReleases().list(releases));
        return releases;
    }

    const Arguments create = asBob(remote, {"cred", "create", url});
    const Arguments set = asBob(remote, {"cred", "set", "c1"});
    const Arguments relayed{"--url", "flk:nas"};
    const Arguments drop{"cred", "delete", "c1", "--json"};
    std::atomic<int> calls = 0;
    std::atomic<int> fatal = 0;
    std::atomic<pid_t> victim = 0;
    std::set<std::string> ended; ///< the sessions that the remote was asked to delete
};

} // namespace

TEST_F(Life, ADeletionSaysWhatBecameOfTheSession) {
    const std::pair<std::string, std::function<void()>> cases[] = {
        {"released", [] {}},
        {"ended_already", [this] { remote.answer("old test_privilege", refusal(119)); }},
        {"kept", [this] { addCred("node_cred", "n1", "c2", "https", remote.port(), "old"); }},
        {"left_behind", [this] { remote.answer("old test_privilege", refusal(105)); }},
        {"left_behind", [this] { remote.before("delete", [] {}); }},
        {"left_behind", [this] { remote.die(); }},
    };
    for (const auto &[word, arrange] : cases) {
        begin();
        arrange();
        EXPECT_EQ(run(drop + Arguments{"--dry-run"}).json()["data"]["row"], "present");
        const Result result = run(drop);
        EXPECT_EQ(result.exit, 0);
        EXPECT_EQ(result.json()["data"]["session"], word) << result.out;
        EXPECT_EQ(querySql("SELECT 1 FROM node_cred WHERE cred_id = 'c1'"), "");
        EXPECT_EQ(pending().size(), word == "left_behind" ? 1U : 0U) << result.out;
    }
}

TEST_F(Life, ACommandThatIsKilledAnywhereLeavesTheOldOrTheNewStateAndNoSessionUnseen) {
    ASSERT_TRUE(OvraPlatform::writeFarlinkSettings({"127.0.0.1", remote.port(), ""}));
    const std::pair<Arguments, std::string> cases[] = {// with the sessions in the rows afterwards
                                                       {create, "old\ngranted-s3cret\n"},
                                                       {set, "granted-s3cret\n"},
                                                       {set + relayed, "granted-s3cret\n"},
                                                       {drop, ""}};
    for (const auto &[command, after] : cases) {
        begin();
        runUntil(command, 0);
        const int last = calls;
        EXPECT_EQ(sessions(), after);
        EXPECT_GE(last, 3);
        const bool moves = command.back() == relayed.back();
        for (int call = 1; call <= last; ++call) {
            SCOPED_TRACE(command[1] + " killed at call " + std::to_string(call));
            begin();
            remote.forgetCalls();
            runUntil(command, call);
            const std::string rows = sessions();
            EXPECT_TRUE(rows == "old\n" || rows == after) << rows;
            EXPECT_EQ(querySql("SELECT protocol FROM node_cred WHERE protocol = 'flk'") == "flk\n",
                      moves && rows == after);
            EXPECT_EQ(run({"session", "pending", "--retry"}).exit, 0);
            EXPECT_TRUE(pending().empty());
            const bool needed = rows.find("old") != std::string::npos;
            EXPECT_EQ(remote.calls().find("old delete") == std::string::npos, needed);
            const bool granted = remote.calls().find("granted-s3cret") != std::string::npos;
            const bool used = rows.find("granted-s3cret") != std::string::npos;
            EXPECT_EQ(ended.count("granted-s3cret") != 0, granted && !used);
        }
    }
}

TEST_F(Life, CommandsAtTheSameTimeLeaveNoSessionThatNobodyKnows) {
    const Arguments other{"cred", "delete", "c2", "--json"};
    // The last ones are killed when the session that they share is to be released.
    const std::tuple<Arguments, Arguments, bool> cases[] = {
        {set, set, false}, {set, drop, false}, {drop, other, false}, {drop, other, true}};
    for (const auto &[one, another, killed] : cases) {
        SCOPED_TRACE(one[1] + " and " + another[1] + " " + another[2]);
        begin();
        const bool sharing = another == other;
        if (sharing) {
            addCred("node_cred", "n1", "c2", "https", remote.port(), "old");
        }
        std::atomic<int> grants = 0;
        std::atomic<int> arrived = 0;
        std::atomic<pid_t> pids[2] = {0, 0};
        const auto meet = [&arrived] { // both know the row before either changes it
            ++arrived;
            for (int i = 0; i < 1000 && arrived < 2; ++i) {
                std::this_thread::sleep_for(std::chrono::milliseconds(5));
            }
        };
        remote.before("login", meet);
        remote.before("test_privilege", [&] { sharing || arrived >= 2 ? void() : meet(); });
        remote.before("create", [&] {
            remote.answer("create",
                          success(R"({"session":"granted-)" + std::to_string(++grants) + "\"}"));
        });
        if (killed) {
            remote.before("delete", [&pids] {
                do { // so that the other one ends
                    std::this_thread::sleep_for(std::chrono::milliseconds(300));
                } while (pids[0] == 0 || pids[1] == 0);
                kill(pids[0], SIGKILL);
                kill(pids[1], SIGKILL);
            });
        }
        Program first(one, "secret word\n");
        Program second(another, "secret word\n");
        pids[0] = first.pid();
        pids[1] = second.pid();
        const std::string said = first.finish().out + second.finish().out;

        std::string known = sessions();
        for (const PendingRelease &release : pending()) {
            known += release.session + "\n";
        }
        for (int i = 0; i <= grants; ++i) {
            const std::string session = i == 0 ? "old" : "granted-" + std::to_string(i);
            EXPECT_TRUE(ended.count(session) != 0 || known.find(session) != std::string::npos)
                << session << " lives, and nobody knows";
        }
        if (sharing && !killed) {
            EXPECT_NE(said.find("\"kept\""), std::string::npos) << said;
            EXPECT_NE(said.find("\"released\""), std::string::npos) << said;
        }
    }
}

TEST_F(Life, ASessionWhoseRowCannotBeStoredIsNotedForRelease) {
    executeSql(
        "CREATE TRIGGER ins BEFORE INSERT ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END;"
        "CREATE TRIGGER up BEFORE UPDATE ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END");
    for (const Arguments &command : {create, set}) {
        std::filesystem::remove(OvraApps::kPendingReleasesFile);
        EXPECT_EQ(run(command, "secret word\n").exit, 9);
        ASSERT_EQ(pending().size(), 1U) << command[1];
        EXPECT_EQ(pending()[0].session, "granted-s3cret");

        std::filesystem::remove(OvraApps::kPendingReleasesFile);
        remote.answer("granted-s3cret test_privilege", refusal(105)); // it does not pass its test
        EXPECT_EQ(run(command, "secret word\n").exit, 1);
        ASSERT_EQ(pending().size(), 1U) << command[1];
        EXPECT_EQ(pending()[0].session, "granted-s3cret");
        remote.answer("granted-s3cret test_privilege", success("{}"));
    }
}

TEST_F(Life, ACredentialMovesWithItsSessionToAnEndpointOfItsNode) {
    addCred("node_cred", "n1", "c2", "https", remote.port(), "old");
    EXPECT_EQ(run(create, "secret word\n").exit, 0) << "the key is known from here on";
    const std::string port = ":" + std::to_string(remote.port());
    const auto expectMove = [&](const std::string &host, int exit, const char *row) {
        const Result result =
            run({"cred", "set", "c1", "--url", "https://" + host + port, "--json"});
        EXPECT_EQ(result.exit, exit) << result.out;
        EXPECT_EQ(querySql("SELECT addr, session FROM node_cred WHERE cred_id = 'c1'"), row);
        return result.json()["data"];
    };
    remote.answer("get", success(R"({"account":"joe"})"));
    const std::tuple<const char *, std::string, int> refusals[] = {
        {"info", success(R"({"node_id":"n2","serial":"S"})"), 1},
        {"info", refusal(119), 4},
        {"old test_privilege", refusal(105), 8},
    };
    for (const auto &[call, answer, exit] : refusals) {
        admitBob(remote);
        remote.answer(call, answer);
        expectMove("localhost", exit, "127.0.0.1|old\n");
    }
    EXPECT_EQ(run({"cred", "set", "c1"}).exit, 2);
    EXPECT_EQ(run({"cred", "set", "c1", "--url", url, "--password-stdin"}).exit, 2);
    remote.answer("old test_privilege", success("{}"));
    const Json::Value moved = expectMove("localhost", 0, "localhost|old\n");
    EXPECT_EQ(moved["session"].asString() + moved["account"].asString(), "unchangedjoe");
    EXPECT_TRUE(moved["endpoint_changed"].asBool());
    EXPECT_EQ(querySql("SELECT addr FROM node_cred WHERE cred_id = 'c2'"), "127.0.0.1\n");

    remote.server.changeCertificate(); // another key, and nobody who vouches for it
    remote.server.closeConnections();
    remote.forgetCalls();
    expectMove("[::ffff:127.0.0.1]", 6, "localhost|old\n");
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(Life, ASessionIsNotReleasedWhileACredentialIsMadeWithIt) {
    // The remote grants the session whose release is still pending.
    ASSERT_TRUE(PendingReleases().note(
        {"granted-s3cret", OvraDRNode::Conn::https("127.0.0.1", remote.port()), "n1", "c0"}));
    std::optional<Program> releasing;
    remote.before("create", [&] {
        releasing.emplace(Arguments{"session", "pending", "--retry", "--json"});
        std::this_thread::sleep_for(std::chrono::milliseconds(500));
    });
    EXPECT_EQ(run(create, "secret word\n").exit, 0);
    EXPECT_EQ(releasing->finish().json()["data"]["tried"][0]["session"], "kept");
    EXPECT_TRUE(ended.empty());
}

TEST_F(Life, AReleaseBehindAFlowThatDoesNotEndIsPutOff) {
    const OvraApps::SessionLock flow("n1", OvraApps::SessionLock::Purpose::kObtain, 0);
    PendingReleases store;
    ASSERT_TRUE(store.note({"s", OvraDRNode::Conn::https("127.0.0.1", 1), "n1", "c0"}));
    EXPECT_EQ(OvraApps::retryRelease(pending()[0], store, 0).code, 107);
    EXPECT_EQ(pending()[0].attempts, 1);
}

TEST(PendingRelease, IsDueAgainAfterPausesThatGrow) {
    std::time_t now = 1000;
    PendingReleases store("/usr/ovra/var/ovradr/releases.db", [&now] { return now; });
    const auto due = [&store, &now](std::time_t time) {
        std::vector<PendingRelease> releases;
        now = time;
        EXPECT_TRUE(store.listDue(releases, 8));
        return !releases.empty();
    };
    const PendingRelease note{"session", OvraDRNode::Conn::https("h", 1), "n", "c"};
    ASSERT_TRUE(store.note(note));
    EXPECT_FALSE(due(1000 + PendingReleases::kHold - 1)) << "the command is still at work";
    EXPECT_TRUE(due(1000 + PendingReleases::kHold));
    for (const int pause : {30, 60, 120, 240, 480, 960, 1920, 3840, 7680, 15360, 21600, 21600}) {
        const std::time_t failed = now;
        ASSERT_TRUE(store.postpone(note, 500));
        EXPECT_FALSE(due(failed + pause - 1)) << pause;
        EXPECT_TRUE(due(failed + pause)) << pause;
    }
    EXPECT_TRUE(due(0)) << "the clock was set back";
    EXPECT_EQ(modeOf(OvraApps::kPendingReleasesFile), 0600U);
    EXPECT_TRUE(store.remove(note));
    EXPECT_FALSE(due(1 << 30));
}

TEST(PendingRelease, NotesAreOneForEachSessionAndCredentialAndBounded) {
    PendingReleases store;
    const PendingRelease note{"session", OvraDRNode::Conn::https("h", 1), "n", "c"};
    PendingRelease other = note;
    other.credId = "c2";
    ASSERT_TRUE(store.note(note) && store.note(other));
    EXPECT_TRUE(store.postpone(other, 500) && store.remove(note));
    std::vector<PendingRelease> left;
    EXPECT_TRUE(store.list(left));
    ASSERT_EQ(left.size(), 1U);
    EXPECT_EQ(left[0].credId + std::to_string(left[0].attempts), "c21");
    OvraTest::RawSqlite file(OvraApps::kPendingReleasesFile);
    ASSERT_TRUE(
        file.run("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
                 std::to_string(PendingReleases::kMaxReleases - 1) +
                 ") INSERT INTO release SELECT i, i, 'h', 'https', 1, 'n', i, 0, 0, 0, 0 "
                 "FROM n"));
    EXPECT_FALSE(store.note(note)) << store.error();
    EXPECT_TRUE(store.note(other)) << "a known one";
    EXPECT_TRUE(store.forget(other.reference()) && store.note(note)) << "there is room again";
}

TEST_F(Life, NotesOfAnOlderVersionStayDue) {
    std::ignore = PendingReleases().note({"s", {}, "n1", "c1"});
    OvraTest::RawSqlite file(OvraApps::kPendingReleasesFile);
    ASSERT_TRUE(
        file.run("CREATE TABLE o (reference TEXT PRIMARY KEY, session, addr, protocol, port,"
                 " node_id, cred_id, noted, attempts, next_try, code) WITHOUT ROWID;"
                 "INSERT INTO o SELECT * FROM release; DROP TABLE release;"
                 "ALTER TABLE o RENAME TO release; PRAGMA user_version = 1;"
                 "CREATE INDEX release_next_try ON release (next_try)"));
    ASSERT_EQ(pending().size(), 1U);
    EXPECT_EQ(pending()[0].credId, "c1");
    EXPECT_TRUE(PendingReleases().note({"s", {}, "n1", "c2"})) << "a second one of the session";
    EXPECT_EQ(pending().size(), 2U);
}

TEST(SessionLock, KeepsFlowsWithOneNodeApartAndNoOthers) {
    using OvraApps::SessionLock;
    using Purpose = SessionLock::Purpose;
    const SessionLock obtaining("n1", Purpose::kObtain, 0);
    const SessionLock releasing("../n2", Purpose::kRelease, 0);
    EXPECT_FALSE(obtaining.isBusy() || releasing.isBusy());
    EXPECT_FALSE(SessionLock("n1", Purpose::kObtain, 0).isBusy());
    EXPECT_TRUE(SessionLock("n1", Purpose::kRelease, 0).isBusy());
    EXPECT_TRUE(SessionLock("../n2", Purpose::kObtain, 0).isBusy());
}

} // namespace OvradrTest
