// SPDX-License-Identifier: Apache-2.0
// Two whole appliances on the loopback interface: this process's, and a far one with a file system
// view of its own. Their programs are killed and stopped in the middle of what they do.
#include "faults/own_view.h"
#include "faults/victim.h"
#include "program.h"
#include "shared/pending_releases.h"
#include "support/daemon_program.h"
#include "support/local_node.h"
#include "support/torture.h"

#include <ovraplatform/session_store.h>

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <random>
#include <set>
#include <sstream>

namespace OvradrTest {

namespace {

namespace fs = std::filesystem;
using OvraPlatform::SessionRecord;
using OvraPlatform::SessionStore;
using OvraTest::DaemonProgram;
using OvraTest::Fault;
using OvraTest::tortureScale;
using OvraTest::Victim;

/// The far appliance's files, and where it sees them.
const std::vector<std::pair<std::string, std::string>> kFarView = {
    {"/tmp/far/ovra", "/usr/ovra"},
    {"/tmp/far/caches", "/tmp/.ovradrcache"},
    {"/tmp/far/lock", "/run/lock"}};
constexpr const char *kPassword = "/tmp/password";
const std::string kUrl = "https://127.0.0.2:5001";

/// What one appliance holds of the other, and grants it.
struct Holdings {
    std::multiset<std::string> rows; ///< the sessions of its credentials
    std::set<std::string> granted;   ///< without the log-ins, which end by themselves
    std::set<std::string> noted;
};

class TwoAppliances : public testing::Test {
protected:
    void SetUp() override {
        if (OvraTest::OtherProcess([] { return OvraTest::enterView({}) ? 0 : 1; }).wait() != 0) {
            GTEST_SKIP() << "there are no mount namespaces here";
        }
        for (const auto &[from, to] : kFarView) {
            fs::create_directories(from);
            fs::create_directories(to);
        }
        fs::permissions("/tmp/far/caches", fs::perms::owner_all);
        fs::permissions("/tmp/.ovradrcache", fs::perms::owner_all);
        writeFile(kPassword, "correct horse");
        chmod(kPassword, 0600);
        for (const bool far : {false, true}) {
            ASSERT_EQ(finish({"setup", "--address", far ? "127.0.0.2" : "127.0.0.1"}, far), 0);
            for (const char *user : {"ann", "bob"}) {
                ASSERT_EQ(
                    finish({"user", "add", user, "--admin", "--password-file", kPassword}, far), 0);
            }
            startDaemon(far);
        }
        key_ = run({"conn", "test", kUrl, "--json"}).json()["data"]["fingerprint"].asString();
        ASSERT_FALSE(key_.empty());
    }

    static std::unique_ptr<DaemonProgram> start(const char *program, const Arguments &arguments,
                                                bool far, const Victim *victim = nullptr) {
        return std::make_unique<DaemonProgram>(Arguments{program} + arguments, [=] {
            if (far && !OvraTest::enterView(kFarView)) {
                _exit(126);
            }
            if (victim != nullptr) {
                victim->enter();
            }
        });
    }
    /// Runs the command line to its end. \return its exit code; -1 if it was killed
    int finish(const Arguments &arguments, bool far = false, const Victim *victim = nullptr) {
        auto program = start(OVRADR_PROGRAM, arguments, far, victim);
        const int code = program->wait();
        said_.clear();
        for (std::string line = program->line(); !line.empty(); line = program->line()) {
            said_ += line;
        }
        return code;
    }
    void startDaemon(bool far) {
        daemons_[far] = start(OVRADRD_PROGRAM, {}, far, &daemonVictims_[far]);
        const std::string line = daemons_[far]->line();
        EXPECT_NE(line.find("ready"), std::string::npos) << line;
    }

    static std::string database(bool far) {
        return far ? "/tmp/far/ovra/etc/ovradr/node.db" : OvraTest::kNodeDatabase;
    }
    static std::string state(bool far) {
        return std::string(far ? "/tmp/far/ovra" : "/usr/ovra") + "/var/ovradr/";
    }
    static std::vector<std::string> lines(const std::string &sql, bool far) {
        std::istringstream rows(OvraTest::querySql(sql, database(far).c_str()));
        std::vector<std::string> all;
        for (std::string line; std::getline(rows, line);) {
            all.push_back(line);
        }
        return all;
    }
    static std::vector<std::string> credentials(bool far) {
        return lines("SELECT cred_id FROM node_cred ORDER BY cred_id", far);
    }
    static Holdings holdings(bool far) {
        Holdings all;
        for (const std::string &row : lines("SELECT session FROM node_cred", far)) {
            all.rows.insert(row);
        }
        std::vector<SessionRecord> sessions;
        EXPECT_TRUE(SessionStore(state(far) + "sessions.db").list(sessions));
        for (const SessionRecord &session : sessions) {
            if (!session.expires) {
                all.granted.insert(session.id);
            }
        }
        std::vector<OvraApps::PendingRelease> notes;
        EXPECT_TRUE(OvraApps::PendingReleases(state(far) + "releases.db").list(notes));
        for (const auto &note : notes) {
            all.noted.insert(note.session);
        }
        return all;
    }
    /// How many sessions are neither in use nor noted by the appliance to which they were granted.
    static std::size_t unknown(const Holdings &holder, const Holdings &granter) {
        std::size_t count = 0;
        for (const std::string &session : granter.granted) {
            count += holder.rows.count(session) + holder.noted.count(session) == 0 ? 1U : 0U;
        }
        return count;
    }
    /// \param unseen  how many sessions may be known only to the appliance that granted them: the
    /// next
    ///                credential for the same account gets them
    static void expectNothingLost(std::size_t unseen) {
        const Holdings both[] = {holdings(false), holdings(true)};
        for (const bool far : {false, true}) {
            EXPECT_EQ(lines("PRAGMA integrity_check", far), std::vector<std::string>{"ok"});
            for (const std::string &row : both[far].rows) {
                EXPECT_EQ(both[!far].granted.count(row), 1U) << "a row without a session, " << far;
            }
            EXPECT_LE(unknown(both[far], both[!far]), unseen)
                << "sessions that nobody knows, " << far;
        }
    }
    static void forgetCaches() {
        for (const char *caches : {"/tmp/.ovradrcache", "/tmp/far/caches"}) {
            for (const auto &entry : fs::directory_iterator(caches)) {
                fs::remove_all(entry.path());
            }
        }
    }

    Arguments create(const char *account) const {
        return {"cred",    "create",        kUrl, "--account", account, "--password-file",
                kPassword, "--fingerprint", key_};
    }
    /// Succeeds, and says so if it does not.
    void expectDone(const Arguments &arguments, bool far = false) {
        EXPECT_EQ(finish(arguments, far), 0) << arguments[1] << ": " << said_;
    }
    /// Every session is in use or noted; then both part, and none is left.
    void settle() {
        forgetCaches();
        for (const char *account : {"ann", "bob"}) {
            expectDone(create(account));
            expectDone({"cred", "reverse", credentials(false).at(0), "--account", account});
        }
        for (const bool far : {false, true}) {
            expectDone({"session", "pending", "--retry"}, far);
        }
        expectNothingLost(0);
        for (const bool far : {false, true}) {
            for (const std::string &cred : credentials(far)) {
                expectDone({"cred", "delete", cred}, far);
            }
        }
        for (const bool far : {false, true}) {
            const Holdings left = holdings(far);
            EXPECT_EQ(left.rows.size() + left.granted.size() + left.noted.size(), 0U) << far;
            EXPECT_TRUE(
                SessionStore(state(far) + "sessions.db").removeIf([](const SessionRecord &) {
                    return true;
                }));
        }
    }

    std::string key_;
    std::string said_;
    const Victim caller_{"caller", OVRA_FAULTS_LIBRARY};
    const Victim daemonVictims_[2] = {{"near", OVRA_FAULTS_LIBRARY}, {"far", OVRA_FAULTS_LIBRARY}};
    std::map<bool, std::unique_ptr<DaemonProgram>> daemons_;
};

} // namespace

TEST_F(TwoAppliances, KilledInTheMiddleOfAFlowTheyLoseNoSession) {
    std::mt19937 random(13);
    std::map<std::pair<std::size_t, bool>, int>
        calls; // of a whole flow, by the flow and who is killed
    const int rounds = tortureScale() == 1 ? 16 : 20 * tortureScale();
    int kills = 0;
    const auto begin = std::chrono::steady_clock::now();
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        const std::size_t flow = static_cast<std::size_t>(round) / 2 % 4;
        const bool far = round % 2 == 1;
        if (credentials(false).empty()) {
            expectDone(create("ann"));
        }
        const std::string cred = credentials(false).at(0);
        const char *const account = round % 3 == 0 ? "ann" : "bob";
        const Arguments flows[] = {
            create(account),
            {"cred", "set", cred, "--account", account, "--password-file", kPassword},
            {"cred", "reverse", cred, "--account", account},
            {"cred", "delete", cred}};
        const Victim &victim = far ? daemonVictims_[true] : caller_;
        int &all = calls[{flow, far}];
        const int at =
            1 + static_cast<int>(random() % (all == 0 ? 600U : static_cast<unsigned>(all)));
        victim.arm(Fault::kKill, at);
        finish(flows[flow], false, far ? nullptr : &caller_);
        victim.disarm();
        all = victim.met() ? all : at - victim.left();
        SCOPED_TRACE(flows[flow][1] + ", call " + std::to_string(at) + " of " +
                     std::to_string(all) + (far ? " of the far daemon" : " of the caller"));
        kills += victim.met() ? 1 : 0;
        if (far && victim.met()) {
            daemons_[true]->wait();
            fs::remove(state(true) + "logins.db"); // log-ins that did not end count as guesses
            startDaemon(true);
        }
        forgetCaches();
        expectDone({"session", "pending", "--retry"});
        expectNothingLost(2);
        if (round % 16 == 15) {
            settle();
        }
    }
    std::printf("%d flows, %d kills, %.0f s\n", rounds, kills,
                std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count());
}

/// What the check above is worth.
TEST_F(TwoAppliances, ANoteThatCannotBeWrittenIsNoticed) {
    expectDone(create("ann"));
    EXPECT_EQ(unknown(holdings(false), holdings(true)), 0U);
    fs::remove(state(false) + "releases.db");
    fs::create_directory(state(false) + "releases.db");
    daemons_.erase(true);
    expectDone({"cred", "delete", credentials(false).at(0)});
    fs::remove(state(false) + "releases.db");
    EXPECT_EQ(unknown(holdings(false), holdings(true)), 1U);
}

TEST_F(TwoAppliances, NobodyWaitsLongForOneWhoIsStopped) {
    std::mt19937 random(14);
    expectDone(create("ann"));
    expectDone(create("bob"));
    const std::string creds[] = {credentials(false).at(0), credentials(false).at(1)};
    const std::string node = lines("SELECT node_id FROM node_cred", false).at(0);
    // With the seconds in which it ends: those of its locks, of a silent peer, and of a busy
    // machine.
    const std::tuple<Arguments, int, bool> others[] = {
        {{"node", "id"}, 15, true},
        {{"user", "list"}, 15, false},
        {{"cred", "list"}, 30, true},
        {{"attr", "set", "local", "app", "name", "value"}, 30, false},
        {{"call", node, "OVRA.DR.Node", "info"}, 60, true},
        {{"conn", "trust", "https://n.example:1", "--fingerprint", key_}, 15, false},
        {{"cred", "set", creds[1], "--account", "bob", "--password-file", kPassword}, 130, false},
        {{"cred", "delete", creds[0]}, 130, false},
    };
    const Arguments flows[] = {
        create("ann"),
        {"cred", "set", creds[1], "--account", "ann", "--password-file", kPassword},
        {"cred", "reverse", creds[1], "--account", "ann"}};
    std::map<std::string, double> longest;
    const int rounds = tortureScale() == 1 ? 1 : tortureScale() / 2;
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        const Arguments &flow = flows[round / 3 % 3];
        const int role = (round + 1) % 3; // the caller, the far daemon, the near daemon
        const Victim &victim = role == 0 ? caller_ : daemonVictims_[role == 1];
        const int at = 1 + static_cast<int>(random() % 500U);
        SCOPED_TRACE(flow[1] + ", role " + std::to_string(role) + " stopped at call " +
                     std::to_string(at));
        victim.arm(Fault::kStop, at);
        auto stopped = start(OVRADR_PROGRAM, flow, false, role == 0 ? &caller_ : nullptr);
        for (int i = 0; i < 300 && !victim.met(); ++i) {
            usleep(5'000);
        }
        for (const auto &[other, bound, quick] : others) {
            if (tortureScale() > 1 || quick) {
                const auto begin = std::chrono::steady_clock::now();
                auto program = start(OVRADR_PROGRAM, other, false);
                int code = -1;
                while (code == -1 &&
                       std::chrono::steady_clock::now() < begin + std::chrono::seconds(bound)) {
                    code = program->wait();
                }
                const std::chrono::duration<double> took = std::chrono::steady_clock::now() - begin;
                EXPECT_GE(code, 0)
                    << other[0] << ' ' << other[1] << " after " << took.count() << " s";
                EXPECT_TRUE(code == 0 || !program->line().empty()) << other[0] << ' ' << other[1];
                double &most = longest[other[0] + " " + other[1].substr(0, 6)];
                most = std::max(most, took.count());
            }
        }
        victim.disarm();
        kill(role == 0 ? stopped->pid() : daemons_[role == 1]->pid(), SIGCONT);
        int code = -1;
        for (int i = 0; i < 4 && code == -1; ++i) {
            code = stopped->wait();
        }
        EXPECT_GE(code, 0) << "it goes on";
        forgetCaches();
        expectDone({"session", "pending", "--retry"});
        expectNothingLost(2);
    }
    for (const auto &[what, seconds] : longest) {
        std::printf("%-12s %.1f s at most\n", what.c_str(), seconds);
    }
    settle();
}

TEST_F(TwoAppliances, AClockThatJumpsAYearHarmsNothing) {
    constexpr int kYear = 365 * 24 * 3600;
    std::mt19937 random(15);
    const int rounds = tortureScale() == 1 ? 2 : tortureScale() / 2;
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        const bool far = round / 2 % 2 == 1;
        const Victim &victim = daemonVictims_[far];
        const Victim *const caller = far ? nullptr : &victim; // they have one clock
        const int at = 1 + static_cast<int>(random() % 400U);
        const int jump = round % 2 == 0 ? kYear : -kYear;
        SCOPED_TRACE(std::string(far ? "far" : "near") + ", call " + std::to_string(at) + ", " +
                     std::to_string(jump));
        victim.arm(Fault::kClock, at, jump);
        const int code = finish(create("ann"), false, caller);
        EXPECT_GE(code, 0) << said_;
        EXPECT_TRUE(code == 0 || !said_.empty());
        for (const char *account : {"ann", "bob"}) { // with the new time from the beginning
            EXPECT_EQ(finish(create(account), false, caller), 0) << said_;
        }
        EXPECT_EQ(finish({"cred", "reverse", credentials(false).at(0), "--account", "ann"}, false,
                         caller),
                  0)
            << said_;
        victim.disarm();
        settle();
    }
}

} // namespace OvradrTest
