// SPDX-License-Identifier: Apache-2.0
// The fate of rows and sessions when a credential is changed or deleted, completely or partly.
#include "platform/store/raw_sqlite.h"
#include "program.h"
#include "shared/pending_releases.h"
#include "shared/session_lock.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <ovradrcore/json.h>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <csignal>
#include <filesystem>
#include <set>
#include <thread>

namespace OvradrTest {

namespace {

using OvraApps::PendingRelease;
using OvraApps::PendingReleases;
using OvraTest::addCred;
using OvraTest::executeSql;
using OvraTest::querySql;
using OvraTest::RemoteNode;

constexpr const char *kDead = R"({"success":false,"error":{"code":119}})";

/// A credential "c1" with the session "old"; the remote grants "granted" and deletes sessions on
/// request.
class Life : public testing::Test {
protected:
    Life() {
        EXPECT_EQ(run({"setup"}).exit, 0);
        begin();
    }

    void begin() {
        std::filesystem::remove(OvraApps::kPendingReleasesFile);
        ended.clear();
        executeSql("DELETE FROM node_cred");
        addCred("node_cred", "n1", "c1", "https", remote.port(), "old");
        remote.answer("login", R"({"success":true,"data":{"sid":"login-session"}})");
        remote.answer("info", R"({"success":true,"data":{"node_id":"n1","serial":"S1"}})");
        remote.answer("create", R"({"success":true,"data":{"session":"granted"}})");
        for (const char *session : {"old", "granted", "granted-1", "granted-2"}) {
            remote.answer(session + std::string(" test_privilege"), R"({"success":true})");
        }
        remote.before("delete", [this] { forgetDeleted(); });
    }

    void forgetDeleted() {
        Json::Value params;
        EXPECT_TRUE(OvraDRCore::fromString(params, remote.params("delete")));
        ended.insert(params["session"].asString());
        remote.answer(params["session"].asString() + " test_privilege", kDead);
    }

    /// Kills the program at its intended last call.
    void count() {
        if (++calls == fatal) {
            while (victim == 0) {
            }
            kill(victim, SIGKILL);
        }
    }

    Arguments change(const Arguments &command) const {
        Arguments all{"cred"};
        all.insert(all.end(), command.begin(), command.end());
        for (const char *word : {"--account", "bob", "--password-stdin", "--fingerprint"}) {
            all.emplace_back(word);
        }
        all.push_back(remote.server.fingerprint());
        return all;
    }
    Arguments create() const {
        return change({"create", "https://127.0.0.1:" + std::to_string(remote.port())});
    }

    /// Runs the program and kills it when the remote gets the call with that number, before the
    /// answer; 0: never.
    void runUntil(const Arguments &arguments, int call) {
        for (const char *method :
             {"probe", "login", "info", "create", "test_privilege", "logout"}) {
            remote.before(method, [this] { count(); });
        }
        remote.before("delete", [this] {
            forgetDeleted();
            count();
        });
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

    std::atomic<int> calls = 0;
    std::atomic<int> fatal = 0;
    std::atomic<pid_t> victim = 0;
    std::set<std::string> ended; ///< the sessions that the remote was asked to delete
    RemoteNode remote;
};

} // namespace

TEST_F(Life, ADeletionSaysWhatBecameOfTheSession) {
    const struct {
        const char *word;
        std::function<void()> arrange;
        int pending;
    } cases[] = {
        {"released", [] {}, 0},
        {"ended_already", [this] { remote.answer("old test_privilege", kDead); }, 0},
        {"kept", [this] { addCred("node_cred", "n1", "c2", "https", remote.port(), "old"); }, 0},
        {"left_behind",
         [this] {
             remote.answer("old test_privilege", R"({"success":false,"error":{"code":105}})");
         },
         1},
        {"left_behind", [this] { remote.before("delete", [] {}); }, 1},
        {"left_behind", [this] { remote.die(); }, 1},
    };
    for (const auto &each : cases) {
        begin();
        each.arrange();
        const Json::Value foreseen = run({"cred", "delete", "c1", "--dry-run", "--json"}).json();
        EXPECT_EQ(foreseen["data"]["row"], "present");
        const Result result = run({"cred", "delete", "c1", "--json"});
        EXPECT_EQ(result.exit, 0);
        EXPECT_EQ(result.json()["data"]["session"], each.word) << result.out;
        EXPECT_EQ(querySql("SELECT 1 FROM node_cred WHERE cred_id = 'c1'"), "");
        EXPECT_EQ(pending().size(), static_cast<std::size_t>(each.pending)) << result.out;
    }
}

TEST_F(Life, ACommandThatIsKilledAnywhereLeavesTheOldOrTheNewStateAndNoSessionUnseen) {
    const struct {
        Arguments command;
        std::string after; ///< the sessions in the rows
    } cases[] = {{create(), "old\ngranted\n"},
                 {change({"set", "c1"}), "granted\n"},
                 {{"cred", "delete", "c1"}, ""}};
    for (const auto &each : cases) {
        begin();
        runUntil(each.command, 0);
        const int last = calls;
        EXPECT_EQ(sessions(), each.after);
        EXPECT_GE(last, 3);
        for (int call = 1; call <= last; ++call) {
            SCOPED_TRACE(each.command[1] + " killed at call " + std::to_string(call));
            begin();
            remote.forgetCalls();
            runUntil(each.command, call);
            const std::string rows = sessions();
            EXPECT_TRUE(rows == "old\n" || rows == each.after) << rows;
            EXPECT_EQ(run({"session", "pending", "--retry"}).exit, 0);
            EXPECT_TRUE(pending().empty());
            const bool needed = rows.find("old") != std::string::npos;
            EXPECT_EQ(remote.calls().find("old delete") == std::string::npos, needed);
        }
    }
}

TEST_F(Life, CommandsAtTheSameTimeLeaveNoSessionThatNobodyKnows) {
    const Arguments set = change({"set", "c1"});
    const Arguments drop{"cred", "delete", "c1", "--json"};
    const Arguments other{"cred", "delete", "c2", "--json"};
    const struct {
        const char *what;
        Arguments first;
        Arguments second;
        bool killed; ///< both, when the session that they share is to be released
    } cases[] = {{"two changes", set, set, false},
                 {"change and deletion", set, drop, false},
                 {"two that share", drop, other, false},
                 {"two that share, killed", drop, other, true}};
    for (const auto &each : cases) {
        SCOPED_TRACE(each.what);
        begin();
        const bool sharing = each.second == other;
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
            remote.answer("create", R"({"success":true,"data":{"session":"granted-)" +
                                        std::to_string(++grants) + R"("}})");
        });
        remote.before("delete", [&] {
            if (each.killed) {
                do { // so that the other one ends
                    std::this_thread::sleep_for(std::chrono::milliseconds(300));
                } while (pids[0] == 0 || pids[1] == 0);
                kill(pids[0], SIGKILL);
                kill(pids[1], SIGKILL);
            } else {
                forgetDeleted();
            }
        });
        Program first(each.first, "secret word\n");
        Program second(each.second, "secret word\n");
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
        if (sharing && !each.killed) {
            EXPECT_NE(said.find("\"kept\""), std::string::npos) << said;
            EXPECT_NE(said.find("\"released\""), std::string::npos) << said;
        }
    }
}

TEST_F(Life, ASessionWhoseRowCannotBeStoredIsNotedForRelease) {
    executeSql(
        "CREATE TRIGGER ins BEFORE INSERT ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END;"
        "CREATE TRIGGER up BEFORE UPDATE ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END");
    for (const Arguments &command : {create(), change({"set", "c1"})}) {
        const Result result = run(command, "secret word\n");
        EXPECT_EQ(result.exit, 9) << result.err;
        ASSERT_FALSE(pending().empty()) << command[1];
        EXPECT_EQ(pending().back().session, "granted");
        EXPECT_TRUE(PendingReleases().remove(pending().back()));
        EXPECT_TRUE(pending().empty());
    }
}

TEST_F(Life, ACredentialMovesWithItsSessionToAnEndpointOfItsNode) {
    addCred("node_cred", "n1", "c2", "https", remote.port(), "old");
    EXPECT_EQ(run(create(), "secret word\n").exit, 0) << "the key is known from here on";
    const auto at = [this](const char *host) {
        return std::string("https://") + host + ":" + std::to_string(remote.port());
    };
    const auto move = [](const std::string &url) {
        return run({"cred", "set", "c1", "--url", url, "--json"});
    };
    const auto row = [] {
        return querySql("SELECT addr, session FROM node_cred WHERE cred_id = 'c1'");
    };
    remote.answer("get", R"({"success":true,"data":{"account":"joe"}})");
    const struct {
        const char *call;
        const char *answer;
        int exit;
    } refusals[] = {
        {"info", R"({"success":true,"data":{"node_id":"n2","serial":"S"}})", 1},
        {"info", kDead, 4},
        {"old test_privilege", R"({"success":false,"error":{"code":105}})", 8},
    };
    for (const auto &each : refusals) {
        remote.answer("info", R"({"success":true,"data":{"node_id":"n1","serial":"S1"}})");
        remote.answer(each.call, std::string(each.answer));
        EXPECT_EQ(move(at("localhost")).exit, each.exit) << each.answer;
    }
    EXPECT_EQ(run({"cred", "set", "c1"}).exit, 2);
    EXPECT_EQ(run({"cred", "set", "c1", "--url", at("localhost"), "--password-stdin"}).exit, 2);
    EXPECT_EQ(row(), "127.0.0.1|old\n");
    remote.answer("old test_privilege", R"({"success":true})");
    const Json::Value moved = move(at("localhost")).json()["data"];
    EXPECT_EQ(moved["session"].asString() + moved["account"].asString(), "unchangedjoe");
    EXPECT_TRUE(moved["endpoint_changed"].asBool());
    EXPECT_EQ(row(), "localhost|old\n");
    EXPECT_EQ(querySql("SELECT addr FROM node_cred WHERE cred_id = 'c2'"), "127.0.0.1\n");

    remote.server.changeCertificate();
    remote.server.closeConnections();
    remote.forgetCalls();
    EXPECT_EQ(move(at("[::ffff:127.0.0.1]")).exit, 6)
        << "another key, and nobody who vouches for it";
    EXPECT_EQ(remote.calls(), "");
    EXPECT_EQ(row(), "localhost|old\n");
}

TEST_F(Life, WhatIsStillNeededIsNotReleased) {
    // The state left by a deletion killed before removing the row.
    PendingRelease note{"old", OvraDRNode::Conn::https("127.0.0.1", remote.port()), "n1", "c1"};
    ASSERT_TRUE(PendingReleases().note(note));
    EXPECT_EQ(
        run({"session", "pending", "--retry", "--json"}).json()["data"]["tried"][0]["session"],
        "kept");
    EXPECT_TRUE(pending().empty());
    EXPECT_EQ(remote.calls().find("delete"), std::string::npos);
}

TEST_F(Life, ASessionIsNotReleasedWhileACredentialIsMadeWithIt) {
    // The remote grants the session whose release is still pending.
    ASSERT_TRUE(PendingReleases().note(
        {"granted", OvraDRNode::Conn::https("127.0.0.1", remote.port()), "n1", "c0"}));
    std::optional<Program> releasing;
    remote.before("create", [&] {
        releasing.emplace(Arguments{"session", "pending", "--retry", "--json"});
        std::this_thread::sleep_for(std::chrono::milliseconds(500));
    });
    EXPECT_EQ(run(create(), "secret word\n").exit, 0);
    EXPECT_EQ(releasing->finish().json()["data"]["tried"][0]["session"], "kept");
    EXPECT_EQ(remote.calls().find("granted delete"), std::string::npos);
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
    struct stat status {};
    ASSERT_EQ(stat(OvraApps::kPendingReleasesFile, &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
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
