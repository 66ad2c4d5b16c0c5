// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "call_dispatcher.h"
#include "service/startup.h"
#include "support/misbehaving_server.h"
#include "support/sockets.h"
#include "support/soon.h"

#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>

#include <algorithm>
#include <atomic>
#include <future>
#include <map>
#include <optional>
#include <thread>
#include <tuple>
#include <vector>

namespace {

using OvraBase::UniqueFd;
using namespace OvraTest;
using namespace std::chrono_literals;

const std::string kLongPost = "POST /webapi/query.cgi HTTP/1.1\r\nHost: a\r\nContent-Type: "
                              "application/x-www-form-urlencoded\r\nContent-Length: 90000\r\n\r\n";
constexpr char kGetInfo[] = "api=OVRA.Core.Encryption&version=1&method=getinfo";

class Bounds : public Appliance {
protected:
    void SetUp() override {
        OvraService::raiseDescriptorLimit(16384);
        Appliance::SetUp();
    }
    /// Whether a call is answered in time.
    void expectQuickAnswer() {
        const auto begun = std::chrono::steady_clock::now();
        EXPECT_EQ(http({.body = kGetInfo}).code(), 0);
        EXPECT_EQ(http({.body = kGetInfo, .tls = false}).code(), 0);
        EXPECT_LT(std::chrono::steady_clock::now() - begun, 2s);
    }
};

TEST_F(Bounds, CutOffAClientWhoseRequestTakesTooLong) {
    const struct {
        const char *name;
        bool tls;
        std::string begin; ///< sent at once
        std::string drip;  ///< then every 100 ms
    } clients[] = {{"says nothing", false, "", ""},
                   {"shakes no hands", true, "", ""},
                   {"drips its header", false, "POST /webapi/query.cgi HTTP/1.1\r\nX: ", "a"},
                   {"drips its body", false, kLongPost, "a"}};
    restart({.connections = {.arriving = 1s}});
    for (const auto &client : clients) {
        const UniqueFd connection = dial(port(client.tls));
        const auto begun = std::chrono::steady_clock::now();
        const auto time = [begun] { return std::chrono::steady_clock::now() - begun; };
        say(connection, client.begin);
        while (isOpen(connection) && time() < 10s) {
            std::this_thread::sleep_for(100ms);
            say(connection, client.drip);
        }
        EXPECT_NE(hearAll(connection), "timeout") << client.name;
        EXPECT_GE(time(), 900ms) << client.name;
        EXPECT_LT(time(), 10s) << client.name;
    }
}

TEST_F(Bounds, OfAllBodiesTogetherRefuseWhatIsTooMuch) {
    restart({.unjudged = 1 << 20, .bodies = 100'000});
    const auto tooMuch = [this] { return http({.body = std::string(50'000, 'x')}).code() == 107; };
    {
        const UniqueFd half = dial(port(false));
        say(half, kLongPost + std::string(80'000, 'x'));
        EXPECT_TRUE(soon(tooMuch));
        expectQuickAnswer();
    }
    EXPECT_TRUE(soon([&] { return !tooMuch(); }))
        << "what the client that left had sent still counts";
}

TEST_F(Bounds, OfABodyAreThoseOfALogInUntilItsSessionIsKnown) {
    addAccount("root", true);
    const std::string call = "api=OVRA.DR.Node&version=1&method=test_privilege";
    const std::string sid = "&_sid=" + session("root");
    std::string zeros = "&x=[0";
    for (int i = 0; i < 50'000; ++i) {
        zeros += ",0";
    }
    zeros += "]";
    const std::string text = "&x=%22" + std::string(900'000, 'x') + "%22";
    const struct {
        const char *what;
        std::string body;
        int code;
        bool tls = true;
    } bodies[] = {{"a session", call + sid + text, 0},
                  {"and many values", call + sid + zeros, 0},
                  {"and more of them", call + sid + zeros + "&y=" + zeros.substr(3), 108},
                  {"and what is no JSON", call + sid + text.substr(0, text.size() - 3), 101},
                  {"the session at the end", call + text + sid, 119},
                  {"an unknown session", call + "&_sid=none" + zeros, 119},
                  {"no such method", call + "s" + sid + text, 103},
                  {"what needs none", std::string(kGetInfo) + text, 108},
                  {"a seal", call + "&sealed=" + std::string(50'000, 'x'), 108},
                  {"plain http", call + sid + text, 108, false}};
    for (const auto &each : bodies) {
        for (const bool chunked : {false, true}) {
            EXPECT_EQ(http({.body = each.body, .tls = each.tls, .chunked = chunked}).code(),
                      each.code)
                << each.what;
        }
    }
}

TEST_F(Bounds, Leave500SlowConnectionsNoInfluenceAndHoldWhenMoreComeThanThereMayBe) {
    std::vector<UniqueFd> slow;
    for (int i = 0; i < 500; ++i) {
        slow.push_back(dial(port(i % 2 == 0)));
        say(slow.back(), i % 2 == 0 ? "" : "POST /webapi/query.cgi HTTP/1.1\r\nX: a");
    }
    for (int i = 0; i < 5; ++i) {
        expectQuickAnswer();
    }
    EXPECT_TRUE(std::all_of(slow.begin(), slow.end(), isOpen));
    for (int i = 0; i < 1000; ++i) {
        slow.push_back(dial(port(i % 2 == 0)));
    }
    expectQuickAnswer();
}

TEST_F(Bounds, OfAStoppingDaemonEndTheConnectionWithoutAnAnswer) {
    addAccount("root", true);
    MisbehavingServer silent;
    silent.fallSilent();
    Json::Value params = json(R"({"conns":[{"addr":"127.0.0.1","protocol":"http"}]})");
    params["conns"][0]["port"] = silent.port();
    auto waiting = std::async(std::launch::async, [&] {
        return call("OVRA.DR.Node", 1, "test_connection", params, session("root"));
    });
    EXPECT_TRUE(soon([&] { return silent.connections() > 0; }));
    EXPECT_FALSE(daemon().stop());
    EXPECT_EQ(waiting.get().status, 0);
}

TEST(FullQueues, RefuseAtOnceAndDoNotHoldUpTheLowerOnes) {
    using OvraPlatform::APIQueue;
    const std::tuple<const char *, APIQueue, int> rows[] = {{"relay", APIQueue::kRelay, 8},
                                                            {"twoWay", APIQueue::kTwoWay, 16},
                                                            {"outbound", APIQueue::kOutbound, 16}};
    std::atomic<int> inside = 0;
    std::map<int, std::atomic<int>> replies; // by code
    replies[0] = replies[107] = 0;
    std::promise<void> open;
    const auto opened = open.get_future().share();
    OvraPlatform::APIRegistry registry;
    for (const auto &[method, queue, threads] : rows) {
        registry.add("Test", 1, method, OvraPlatform::APIRight::kNone, queue,
                     [&](const Json::Value &, const auto &) {
                         ++inside;
                         opened.wait();
                         return OvraPlatform::apiSuccess();
                     });
    }
    registry.add("Test", 1, "quick", OvraPlatform::APIRight::kNone, APIQueue::kQuick,
                 [](const Json::Value &, const auto &) { return OvraPlatform::apiSuccess(); });
    Appliance::provision();
    const auto keys = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile).value();
    OvraPlatform::ReplayGuard guard;
    Ovradrd::LoginApi api;
    Ovradrd::SessionUses uses;
    std::optional<Ovradrd::CallDispatcher> dispatcher;
    Ovradrd::WorkQueues queues;
    dispatcher.emplace(registry, keys, guard, api, uses, queues);
    const auto serve = [&](const std::string &method, int client = 1) {
        dispatcher->serve(
            {"api=Test&version=1&method=" + method, "127.0.0." + std::to_string(client), true},
            [&](const std::string &document) {
                ++replies.at(json(document)["error"]["code"].asInt());
            });
    };
    int places = 0;
    int refused = 0;
    for (const auto &[method, queue, threads] : rows) {
        places += threads;
        for (int i = 0; i < threads; ++i) {
            serve(method, 2 + i);
        }
        EXPECT_TRUE(soon([&] { return inside == places; })) << method;
        for (int i = 0; i < 64 + 5; ++i) {
            serve(method);
        }
        refused += 5;
        EXPECT_TRUE(soon([&] { return replies[107] == refused; })) << method;
    }
    serve("quick");
    EXPECT_TRUE(soon([&] { return replies[0] == 1; }));
    open.set_value();
    EXPECT_TRUE(soon([&] { return replies[0] == places + 3 * 64 + 1; }));
    serve("relay");
    EXPECT_TRUE(soon([&] { return replies[0] == places + 3 * 64 + 2; })) << "there is room again";
    EXPECT_EQ(replies[107], refused);
}

} // namespace
