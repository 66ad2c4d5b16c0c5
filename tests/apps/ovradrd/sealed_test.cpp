// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "seal/sealing.h"

#include <ovraplatform/appliance.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/wire_form.h>

#include <optional>

namespace {

using namespace OvraPlatform;
using OvraTest::Appliance;
using OvraTest::json;
using OvraTest::Reply;

class Sealed : public Appliance {
protected:
    void SetUp() override {
        Appliance::SetUp();
        addAccount("alice", true);
        keys = SealKeyPair::load(kSealKeyFile).value();
        inner = {{"OVRA.DR.Node", 1, "test_privilege", {}}, session("alice"), ""};
    }

    /// The call in its envelope.
    WireCall seal(UnixMillis time) {
        const auto sealed = sealRequest(keys->publicKey(), inner, time).value();
        replyKey = sealed.replyKey;
        return {{inner.api, inner.version, inner.method, {}}, "", sealed.envelope};
    }
    Reply post(const WireCall &outer) const {
        return http({.body = encodeForm(outer).value(), .tls = false});
    }
    /// The document inside a sealed reply; null if there is none.
    Json::Value open(const Reply &reply) const {
        const auto text = openReply(replyKey, reply.document);
        return text ? json(*text) : Json::Value();
    }

    std::optional<SealKeyPair> keys;
    WireCall inner;
    ReplyKey replyKey;
};

TEST_F(Sealed, IsAnsweredSealedAndRefusedTheSecondTime) {
    const WireCall outer = seal(wallClock());
    const Reply reply = post(outer);
    EXPECT_EQ(reply.document.getMemberNames(), std::vector<std::string>{"sealed_reply"});
    EXPECT_EQ(open(reply)["success"], true);
    EXPECT_EQ(open(post(outer))["error"]["msg"]["reason"], "replayed");
}

TEST_F(Sealed, IsRefusedWithTheReason) {
    const Json::Value stale = open(post(seal(wallClock() - 120'000)))["error"];
    EXPECT_EQ(stale["code"], 109);
    EXPECT_EQ(stale["msg"]["reason"], "stale");
    EXPECT_NEAR(stale["msg"]["time"].asDouble(), static_cast<double>(wallClock()), 5000);
    WireCall moved = seal(wallClock());
    moved.method = "info";
    EXPECT_EQ(open(post(moved))["error"]["msg"]["reason"], "call");
    WireCall damaged = seal(wallClock());
    damaged.sealed[10] = damaged.sealed[10] == 'A' ? 'B' : 'A';
    const Reply unsealed = post(damaged);
    EXPECT_EQ(unsealed.code(), 109);
    EXPECT_EQ(unsealed.document["error"]["msg"]["reason"], "key");
}

TEST_F(Sealed, IsWhatPlainHttpDemands) {
    const auto code = [this](const char *api, const char *method, const char *params,
                             const std::string &sid) {
        const Reply reply = call(api, 1, method, json(params), sid, false);
        EXPECT_TRUE(reply.code() != 109 || reply.document["error"]["msg"]["reason"] == "unsealed");
        return reply.code();
    };
    const std::string login = R"({"account":"alice","passwd":")" + std::string(kPassword) + "\"}";
    EXPECT_EQ(code("OVRA.Core.Auth", "login", login.c_str(), ""), 109);
    EXPECT_EQ(code("OVRA.DR.Node", "test_privilege", "{}", inner.sid), 109);
    EXPECT_EQ(code("OVRA.DR.Node.Credential", "create", R"({"password":"x"})", ""), 109);
    EXPECT_EQ(code("OVRA.Core.Encryption", "getinfo", "{}", ""), 0);
}

} // namespace
