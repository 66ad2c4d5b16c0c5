// SPDX-License-Identifier: Apache-2.0
#include "relay_api.h"

#include <ovradrcore/json.h>
#include <ovraplatform/farlink_key.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <future>
#include <thread>

namespace {

using Farlinkd::AliasRegistry;
using Farlinkd::RelayApi;
using Farlinkd::TunnelServer;
using OvraPlatform::FarlinkKey;

class TheRelayApi : public testing::Test {
protected:
    explicit TheRelayApi(const RelayApi::Limits &limits = {})
        : api(aliases, {"127.0.0.1", "relay.example", 5444}, limits) {
        EXPECT_TRUE(tunnelServer.start(OvraService::Listener::listen("127.0.0.1", 0).value()));
        api.connect(tunnelServer);
    }
    ~TheRelayApi() override { api.stop(); }

    using Reply = std::future<Json::Value>;
    /// Sends a call; its reply may come later.
    Reply begin(const std::string &method, const Json::Value &params) {
        const OvraPlatform::WireCall call{{"OVRA.Farlink", 1, method, params}, "", ""};
        const auto promise = std::make_shared<std::promise<Json::Value>>();
        api.serve({*encodeForm(call), address, true}, [promise](const std::string &document) {
            Json::Value reply;
            EXPECT_TRUE(OvraDRCore::fromString(reply, document));
            promise->set_value(reply);
        });
        return promise->get_future();
    }
    Json::Value call(const std::string &method, const Json::Value &params) {
        return begin(method, params).get();
    }
    /// 0, or the error code.
    static int code(const Json::Value &reply) { return reply["error"]["code"].asInt(); }

    static FarlinkKey key(const char *name) {
        return FarlinkKey::loadOrCreate(std::string("/usr/ovra/") + name).value();
    }
    Json::Value proof(const FarlinkKey &owner, const std::string &alias) {
        Json::Value params;
        params["alias"] = alias;
        params["key"] = owner.publicText();
        params["challenge"] = call("challenge", params)["data"]["challenge"];
        params["signature"] = owner.sign(alias, params["challenge"].asString());
        return params;
    }
    Json::Value named(const std::string &alias, const Json::Value &token = Json::Value()) {
        Json::Value params;
        params["alias"] = alias;
        params["token"] = token;
        return params;
    }

    std::string address = "192.0.2.1";
    TunnelServer tunnelServer{
        [](const std::string &, const std::string &, const std::string &) { return false; }, {}};
    AliasRegistry aliases{"/usr/ovra/aliases", {20100, 20110, std::chrono::seconds(60), 2}};
    RelayApi api;
};

class TheBoundedRelayApi : public TheRelayApi {
protected:
    TheBoundedRelayApi()
        : TheRelayApi({.aliasesPerHour = 2,
                       .callers = 3,
                       .callersOfOne = 2,
                       .challenge = std::chrono::seconds(2),
                       .hold = std::chrono::seconds(1)}) {}
};

} // namespace

TEST_F(TheRelayApi, GivesAnAliasToWhoProvesTheKeyAndToNobodyElse) {
    const FarlinkKey owner = key("owner");
    const FarlinkKey thief = key("thief");
    EXPECT_EQ(code(call("lookup", named("nas"))), 106) << "nobody has it";
    const Json::Value made = call("enrol", proof(owner, "nas"));
    ASSERT_EQ(code(made), 0) << OvraDRCore::toString(made);
    EXPECT_EQ(code(call("enrol", proof(thief, "nas"))), 105);

    Json::Value replaced = proof(owner, "nas");
    replaced["key"] = thief.publicText(); // not that of the challenge
    Json::Value forged = proof(thief, "nas");
    forged["key"] = owner.publicText(); // not that of the signature
    Json::Value moved = proof(owner, "other");
    moved["alias"] = "nas2"; // not that of the proof
    Json::Value old = proof(owner, "nas");
    const std::string challenge = old["challenge"].asString();
    old["challenge"] = "1." + challenge.substr(challenge.find('.') + 1); // none of ours
    for (const Json::Value &params : {replaced, forged, moved, old}) {
        EXPECT_EQ(code(call("enrol", params)), 105) << params;
    }

    const Json::Value token = made["data"]["token"];
    EXPECT_EQ(code(call("lookup", named("nas"))), 107) << "it asks for no callers yet";
    Reply waiting = begin("wait", named("nas", token));
    for (const char *method : {"wait", "release"}) {
        EXPECT_EQ(code(call(method, named("nas", "guess"))), 119) << method;
        EXPECT_EQ(code(call(method, named("other", token))), 119) << method;
    }
    EXPECT_EQ(call("lookup", named("nas"))["data"]["host"], "relay.example");
    EXPECT_EQ(code(call("release", named("nas", token))), 0);
    EXPECT_EQ(code(call("lookup", named("nas"))), 106);
    EXPECT_EQ(code(call("enrol", proof(thief, "nas"))), 0);
}

TEST_F(TheRelayApi, TellsTheApplianceOfItsCallersAndOfAnotherEnrolment) {
    const FarlinkKey owner = key("owner");
    const Json::Value first = call("enrol", proof(owner, "nas"))["data"]["token"];
    Reply waiting = begin("wait", named("nas", first));
    EXPECT_EQ(waiting.wait_for(std::chrono::milliseconds(100)), std::future_status::timeout);
    EXPECT_TRUE(api.announce("nas", "caller-1", "a"));
    EXPECT_EQ(waiting.get()["data"]["callers"][0], "caller-1");
    EXPECT_TRUE(api.announce("nas", "caller-2", "a")) << "between two questions";
    EXPECT_EQ(call("wait", named("nas", first))["data"]["callers"][0], "caller-2");
    EXPECT_FALSE(api.announce("nobody", "caller-3", "a"));

    waiting = begin("wait", named("nas", first));
    const Json::Value second = call("enrol", proof(owner, "nas"))["data"]["token"];
    EXPECT_EQ(code(waiting.get()), 119) << "the earlier one learns it at once";
    EXPECT_EQ(code(call("wait", named("nas", first))), 119);
    waiting = begin("wait", named("nas", second));
    EXPECT_EQ(waiting.wait_for(std::chrono::milliseconds(100)), std::future_status::timeout);
}

TEST_F(TheRelayApi, ServesEverybodyElseWhileAChangeIsBeingStored) {
    const Json::Value token = call("enrol", proof(key("owner"), "nas"))["data"]["token"];
    Reply waiting = begin("wait", named("nas", token));
    // The registry waits for this lock as for a slow disk, for up to 5 seconds.
    const OvraBase::UniqueFd held(open("/usr/ovra/.lock", O_RDONLY | O_CLOEXEC));
    ASSERT_EQ(flock(held.get(), LOCK_EX), 0);
    std::vector<Reply> changes;
    for (const char *alias : {"two", "three", "four"}) {
        changes.push_back(begin("enrol", proof(key(alias), alias)));
    }
    EXPECT_EQ(changes[0].wait_for(std::chrono::milliseconds(200)), std::future_status::timeout);
    api.endOverdue();
    EXPECT_EQ(code(call("lookup", named("two"))), 106) << "not stored, so nobody has it";
    EXPECT_EQ(code(call("lookup", named("nas"))), 0);
    EXPECT_TRUE(api.announce("nas", "caller", "a"));
    EXPECT_EQ(waiting.get()["data"]["callers"][0], "caller");
    EXPECT_EQ(changes[0].wait_for(std::chrono::seconds(0)), std::future_status::timeout);
    flock(held.get(), LOCK_UN);
    for (Reply &change : changes) {
        EXPECT_EQ(code(change.get()), 0);
    }
}

TEST_F(TheRelayApi, BoundsWhatOneClientMayDo) {
    int attempts = 0;
    address = "2001:db8::ffff";
    while (attempts < 100 && code(call("challenge", named("nas"))) == 0) {
        address = "2001:db8::" + std::to_string(++attempts); // one subscriber has many
    }
    EXPECT_EQ(attempts, 30);
    address = "192.0.2.2";
    EXPECT_EQ(code(call("challenge", named("nas"))), 0) << "others are not held up";
    const auto taken = OvraService::Listener::listen("127.0.0.1", 20100);
    EXPECT_EQ(code(call("enrol", proof(key("owner"), "nas"))), 100) << "its port is in use";
    EXPECT_EQ(code(call("lookup", named("nas"))), 106) << "so it is nobody's";
    for (const char *alias : {"", "ab", "-ab", "ab-", "a b", "a/b", "NAS", "../aliases"}) {
        EXPECT_EQ(code(call("enrol", named(alias))), 106) << alias;
    }
}

TEST_F(TheBoundedRelayApi, NewAliasesCallersChallengesAndPolls) {
    const FarlinkKey owner = key("owner");
    const Json::Value old = proof(owner, "nas-1");
    address = "2001:db8::1";
    const Json::Value token = call("enrol", proof(owner, "nas-1"))["data"]["token"];
    EXPECT_EQ(code(call("enrol", proof(owner, "nas-2"))), 0);
    address = "2001:db8::2";
    EXPECT_EQ(code(call("enrol", proof(key("next"), "nas-3"))), 107) << "a third one in an hour";
    EXPECT_EQ(code(call("enrol", proof(owner, "nas-2"))), 0) << "this one is not new";
    address = "2001:db8:0:1::1";
    EXPECT_EQ(code(call("enrol", proof(key("next"), "nas-3"))), 0) << "another client";

    Reply waiting = begin("wait", named("nas-1", token));
    api.endOverdue();
    EXPECT_EQ(waiting.wait_for(std::chrono::milliseconds(100)), std::future_status::timeout);
    std::this_thread::sleep_for(std::chrono::milliseconds(3100));
    api.endOverdue();
    EXPECT_EQ(waiting.get()["data"]["callers"], Json::Value(Json::arrayValue));
    EXPECT_TRUE(api.announce("nas-1", "caller-1", "a"));
    EXPECT_TRUE(api.announce("nas-1", "caller-2", "a"));
    EXPECT_FALSE(api.announce("nas-1", "caller-3", "a")) << "one client's share";
    EXPECT_TRUE(api.announce("nas-1", "caller-3", "b"));
    EXPECT_FALSE(api.announce("nas-1", "caller-4", "c")) << "it fetches none";
    EXPECT_EQ(code(call("enrol", old)), 105) << "a challenge that is too old";
}

TEST(TheLimitOfARate, ForgetsTheClientThatBeganFirstForOneTooMany) {
    OvraService::RateLimit limit(1, std::chrono::hours(1));
    const auto now = std::chrono::steady_clock::now();
    for (int i = 0; i <= 8192; ++i) {
        EXPECT_TRUE(limit.allow(std::to_string(i), now));
    }
    EXPECT_FALSE(limit.allow("1", now));
    EXPECT_TRUE(limit.allow("0", now)) << "forgotten";
    EXPECT_FALSE(limit.allow("8192", now + std::chrono::minutes(59)));
    EXPECT_TRUE(limit.allow("8192", now + std::chrono::hours(1)));
}
