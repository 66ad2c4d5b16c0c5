// SPDX-License-Identifier: Apache-2.0
// The real daemon, for long: OVRA_TORTURE=100 makes a million calls, a thousand rounds, a thousand
// tries.
#include "platform/store/raw_sqlite.h"
#include "support/sockets.h"
#include "support/soon.h"
#include "support/torture.h"
#include "support/totp.h"
#include "the_program.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/totp.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <future>
#include <optional>
#include <random>
#include <thread>
#include <vector>

namespace {

using namespace OvraTest;
using namespace std::chrono_literals;
using OvraPlatform::kAccountsFile;
using std::chrono::steady_clock;

class Soak : public TheProgram {
protected:
    Soak() {
        configure();
        Appliance::addAccount("root", true);
        start();
    }
    void start() {
        program.emplace();
        ASSERT_EQ(program->line(), ready);
    }
    /// An account like root, with the same password.
    static void copyAccount(const std::string &name) {
        ASSERT_TRUE(RawSqlite(kAccountsFile)
                        .run("INSERT INTO account (name, hash, created) SELECT '" + name +
                             "', hash, created FROM account WHERE name = 'root'"));
    }
    /// A new address: budgets of guesses belong to addresses.
    std::string address() {
        ++addresses;
        return "127." + std::to_string(1 + addresses / 60'000) + "." +
               std::to_string(addresses / 240 % 250) + "." + std::to_string(1 + addresses % 240);
    }
    std::size_t descriptors() const {
        const std::filesystem::directory_iterator all("/proc/" + std::to_string(program->pid()) +
                                                      "/fd");
        return static_cast<std::size_t>(std::distance(begin(all), end(all)));
    }
    /// KiB in memory.
    long memory() const {
        std::ifstream status("/proc/" + std::to_string(program->pid()) + "/status");
        for (std::string line; std::getline(status, line);) {
            if (line.rfind("VmRSS:", 0) == 0) {
                return std::stol(line.substr(6));
            }
        }
        return -1;
    }

    std::optional<Program> program;
    int addresses = 0;
};

TEST_F(Soak, ManyMixedCallsLeakNoDescriptorAndNoMemory) {
    const std::string sid = Appliance::session("root", 24 * 3600);
    const std::string key = "api=OVRA.Core.Encryption&version=1&method=getinfo";
    const std::string info = "api=OVRA.DR.Node&version=1&method=info";
    const std::string own = info + "&_sid=" + sid;
    const std::pair<int, HttpCall> posts[] = {
        {0, {.body = key}},
        {0, {.body = key, .tls = false}},
        {0, {.body = own}},
        {0, {.body = own + "&x=%22" + std::string(50'000, 'x') + "%22", .chunked = true}},
        {119, {.body = info}},
        {101, {.body = "%%%=&&"}},
        {108, {.body = key + "&x=" + std::string(20'000, '[')}},
        {109, {.body = info + "&sealed=AAAA"}},
    };
    const auto isAnswered = [&](const HttpClient &one, unsigned what) {
        if (what >= 80) {
            const auto &[code, call] = posts[what % std::size(posts)];
            return one.http(call).code() == code;
        }
        if (what >= 60) {
            return one.http({.path = "/webman/modules/ovradr//x", .method = "GET"}).status == 404;
        }
        if (what >= 40) {
            return Appliance::callHere("OVRA.DR.Node", 1, "info")["success"] == true;
        }
        if (what >= 20) { // leaves in the middle
            say(dial(std::stoi(http)),
                "POST /webapi/query.cgi HTTP/1.1\r\nContent-Length: 9\r\n\r\n");
            return true;
        }
        if (what >= 2) {
            const Reply lent = one.call("OVRA.DR.Node.Session", 1, "temp_create", {}, sid);
            return one.call("OVRA.DR.Node.Session", 1, "delete", lent.data(), sid).code() == 0;
        }
        const Reply in = one.login(what == 0 ? "root" : "nobody", Appliance::kPassword);
        return what == 0 ? one.call("OVRA.Core.Auth", 1, "logout", {}, in.data()["sid"].asString())
                                   .code() == 0
                         : in.code() == 400 || in.code() == 107; // enough guesses
    };
    std::atomic<int> wrong = 0;
    const auto makeCalls = [&](int calls) {
        std::vector<std::future<void>> threads;
        for (unsigned seed = 0; seed < 4; ++seed) {
            threads.push_back(std::async(std::launch::async, [&, seed] {
                std::mt19937 random(seed);
                for (int i = 0; i < calls / 4;) {
                    const HttpClient one = client(); // makes new connections
                    for (const int end = i + 250; i < end; ++i) {
                        wrong += isAnswered(one, unsigned(random() % 1000)) ? 0 : 1;
                    }
                }
            }));
        }
    };
    const int scale = tortureScale();
    const int calls = scale == 1 ? 2'000 : 10'000 * scale;
    makeCalls(std::max(calls / 10, 1'000)); // what is kept for later calls is there after these
    if (scale > 1) {
        std::this_thread::sleep_for(21s); // freed memory goes back
    }
    const std::size_t opened =
        descriptors() + 8; // threads open their databases when they need them
    const long had = memory();
    makeCalls(calls);
    EXPECT_EQ(wrong, 0);
    EXPECT_TRUE(soon([&] { return descriptors() <= opened; })) << opened << " " << descriptors();
    EXPECT_TRUE(soon([&] { return memory() * 100 < had * 105; })) << had << " " << memory();
    std::printf("%zu descriptors; %ld, then %ld KiB\n", descriptors(), had, memory());
}

TEST_F(Soak, OfEightLogInsAtOnceWithOneCodeOneIsLetInAlsoWhenTheDaemonIsKilledMeanwhile) {
    std::mt19937 random(1);
    const int rounds = tortureScale() == 1 ? 2 : 10 * tortureScale();
    int lost = 0;
    for (int round = 0; round < rounds; ++round) {
        const std::string name = "a" + std::to_string(round);
        copyAccount(name);
        const std::string secret = OvraPlatform::newTotpSecret();
        ASSERT_TRUE(OvraPlatform::AccountStore().setTotp(name, secret));
        const std::string code = totp(secret, std::time(nullptr));
        std::vector<std::future<void>> tries(8);
        for (auto &each : tries) {
            each = std::async(std::launch::async, [&, from = address()] {
                client().login(name, Appliance::kPassword, code, from);
            });
        }
        const bool ended = round % 2 == 1;
        if (ended) { // at some moment
            std::this_thread::sleep_for(std::chrono::milliseconds(random() % 1'000));
            program->end(round % 4 == 1 ? SIGKILL : SIGTERM);
            start();
        }
        tries.clear(); // waits for them
        const auto granted = [&name] {
            return RawSqlite(OvraPlatform::kSessionsFile)
                .cell("SELECT count(*) FROM session WHERE user = '" + name + "'");
        };
        const bool taken = granted() == "1";
        ASSERT_TRUE(taken || (ended && granted() == "0")) << granted();
        lost += taken ? 0 : 1;
        // It may have ended between taking the code and granting the session.
        const int again = client().login(name, Appliance::kPassword, code, address()).code();
        ASSERT_TRUE(again == 404 || (again == 0 && !taken)) << again;
        ASSERT_EQ(granted(), taken || again == 0 ? "1" : "0");
    }
    std::printf("%d rounds, in %d of them the daemon ended first\n", rounds, lost);
}

TEST_F(Soak, ARefusedLogInTakesAsLongForAnUnknownAccount) {
    const int tries = tortureScale() == 1 ? 5 : 10 * tortureScale();
    std::vector<double> known;
    std::vector<double> unknown;
    for (int i = 0; i < tries; ++i) {
        const std::string name = std::to_string(i / 15); // as many as its budget allows
        if (i % 15 == 0) {
            copyAccount("known" + name);
        }
        for (auto *times : {&known, &unknown}) {
            const auto begun = steady_clock::now();
            const Reply reply = client().login((times == &known ? "known" : "unknown") + name,
                                               "wrong password", "", address());
            times->push_back(std::chrono::duration<double>(steady_clock::now() - begun).count());
            ASSERT_EQ(reply.code(), 400);
        }
    }
    const auto median = [](std::vector<double> &times) {
        std::sort(times.begin(), times.end());
        return times[times.size() / 2];
    };
    const double ratio = median(unknown) / median(known);
    std::printf("%.1f and %.1f ms\n", 1000 * median(known), 1000 * median(unknown));
    EXPECT_NEAR(ratio, 1, tries < 200 ? 0.5 : 0.05);
}

} // namespace
