// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "call_dispatcher.h"
#include "support/misbehaving_server.h"

#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>

#include <sys/resource.h>

#include <condition_variable>
#include <future>
#include <list>
#include <map>
#include <mutex>
#include <thread>

namespace {

using OvraTest::Appliance;
using OvraTest::json;
using OvraTest::RawConnection;
using namespace std::chrono_literals;

const std::string kLongPost = "POST /webapi/query.cgi HTTP/1.1\r\nHost: a\r\nContent-Type: "
                              "application/x-www-form-urlencoded\r\nContent-Length: 90000\r\n\r\n";
constexpr char kGetInfo[] = "api=OVRA.Core.Encryption&version=1&method=getinfo";

class Bounds : public Appliance {
protected:
    void SetUp() override {
        rlimit limit{};
        getrlimit(RLIMIT_NOFILE, &limit);
        limit.rlim_cur = limit.rlim_max;
        setrlimit(RLIMIT_NOFILE, &limit);
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
    OvraService::HttpLimits limits;
    limits.connections.arriving = 1s;
    restart(limits);
    for (const auto &client : clients) {
        const RawConnection connection(port(client.tls));
        const auto begun = std::chrono::steady_clock::now();
        const auto time = [begun] { return std::chrono::steady_clock::now() - begun; };
        connection.send(client.begin);
        while (!connection.closesWithin(100ms) && time() < 10s) {
            connection.send(client.drip);
        }
        EXPECT_GE(time(), 900ms) << client.name;
        EXPECT_LT(time(), 10s) << client.name;
    }
}

TEST_F(Bounds, OfAllBodiesTogetherRefuseWhatIsTooMuch) {
    OvraService::HttpLimits limits;
    limits.bodies = 100'000;
    restart(limits);
    const auto becomes = [this](bool refused) {
        for (int i = 0; i < 500; ++i) {
            if ((http({.body = std::string(50'000, 'x')}).code() == 107) == refused) {
                return true;
            }
            std::this_thread::sleep_for(10ms);
        }
        return false;
    };
    {
        const RawConnection half(port(false));
        half.send(kLongPost + std::string(80'000, 'x'));
        EXPECT_TRUE(becomes(true));
        expectQuickAnswer();
    }
    EXPECT_TRUE(becomes(false)) << "what the client that left had sent still counts";
}

TEST_F(Bounds, Leave500SlowConnectionsNoInfluence) {
    std::list<RawConnection> slow;
    for (int i = 0; i < 500; ++i) {
        slow.emplace_back(port(i % 2 == 0));
        ASSERT_TRUE(slow.back().isOpen());
        if (i % 2 != 0) {
            slow.back().send("POST /webapi/query.cgi HTTP/1.1\r\nX: a");
        }
    }
    for (int i = 0; i < 5; ++i) {
        expectQuickAnswer();
    }
    for (const RawConnection &connection : slow) {
        EXPECT_TRUE(connection.isOpen());
    }
}

TEST_F(Bounds, HoldWhenMoreConnectionsComeThanThereMayBe) {
    std::list<RawConnection> flood;
    for (int i = 0; i < 1500; ++i) {
        flood.emplace_back(port(i % 2 == 0));
    }
    expectQuickAnswer();
}

TEST_F(Bounds, OfAStoppingDaemonEndTheConnectionWithoutAnAnswer) {
    addAccount("root", true);
    OvraTest::MisbehavingServer silent;
    silent.fallSilent();
    Json::Value params;
    params["conns"][0] = json(R"({"addr":"127.0.0.1","protocol":"http"})");
    params["conns"][0]["port"] = silent.port();
    auto waiting = std::async(std::launch::async, [&] {
        return call("OVRA.DR.Node", 1, "test_connection", params, session("root"));
    });
    while (silent.connections() == 0) {
        std::this_thread::sleep_for(5ms);
    }
    EXPECT_FALSE(daemon().stop());
    EXPECT_EQ(waiting.get().status, 0);
}

/// A registry with one call that waits and one that does not.
class FullQueues : public testing::Test {
protected:
    FullQueues() {
        using OvraPlatform::APIQueue;
        using OvraPlatform::APIRight;
        for (const auto &[method, queue] :
             {std::pair("relay", APIQueue::kRelay), std::pair("twoWay", APIQueue::kTwoWay),
              std::pair("outbound", APIQueue::kOutbound)}) {
            registry.add("Test", 1, method, APIRight::kNone, queue,
                         [this](const Json::Value &, const OvraPlatform::APICaller &) {
                             std::unique_lock lock(mutex);
                             ++inside;
                             changed.notify_all();
                             changed.wait(lock, [this] { return open; });
                             return OvraPlatform::apiSuccess();
                         });
        }
        registry.add("Test", 1, "quick", APIRight::kNone, APIQueue::kQuick,
                     [](const Json::Value &, const OvraPlatform::APICaller &) {
                         return OvraPlatform::apiSuccess();
                     });
        Appliance::provision();
        keys = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile).value();
        dispatcher.emplace(registry, *keys, guard, api, *queues);
    }
    void serve(const std::string &method) {
        dispatcher->serve({"api=Test&version=1&method=" + method, "127.0.0.1", true},
                          [this](const std::string &document) {
                              const std::lock_guard lock(mutex);
                              ++replies[OvraTest::json(document)["error"]["code"].asInt()];
                              changed.notify_all();
                          });
    }
    /// Whether that many replies had this code within a few seconds.
    bool gets(int code, int count) {
        std::unique_lock lock(mutex);
        return changed.wait_for(lock, 5s, [&] { return replies[code] >= count; });
    }

    std::mutex mutex;
    std::condition_variable changed;
    int inside = 0;
    bool open = false;
    std::map<int, int> replies;
    OvraPlatform::APIRegistry registry;
    std::optional<OvraPlatform::SealKeyPair> keys;
    OvraPlatform::ReplayGuard guard;
    Ovradrd::LoginApi api;
    std::optional<Ovradrd::CallDispatcher> dispatcher;
    std::optional<Ovradrd::WorkQueues> queues{std::in_place};
};

TEST_F(FullQueues, RefuseAtOnceAndDoNotHoldUpTheLowerOnes) {
    int places = 0;
    int refused = 0;
    for (const auto &[method, threads] :
         {std::pair("relay", 8), std::pair("twoWay", 16), std::pair("outbound", 16)}) {
        places += threads;
        for (int i = 0; i < threads; ++i) {
            serve(method);
        }
        {
            std::unique_lock lock(mutex);
            ASSERT_TRUE(changed.wait_for(lock, 5s, [&] { return inside == places; })) << method;
        }
        for (int i = 0; i < 64 + 5; ++i) {
            serve(method);
        }
        refused += 5;
        EXPECT_TRUE(gets(107, refused)) << method;
    }
    serve("quick");
    EXPECT_TRUE(gets(0, 1));
    {
        const std::lock_guard lock(mutex);
        open = true;
    }
    changed.notify_all();
    EXPECT_TRUE(gets(0, places + 3 * 64 + 1));
    EXPECT_EQ(replies[107], refused);
    queues.reset();
}

} // namespace
