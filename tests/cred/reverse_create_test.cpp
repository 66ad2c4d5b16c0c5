// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrcore/json.h>
#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

/// The remote reaches this node at 192.0.2.1:5001 and reports a credential "r1".
class ReverseCreation : public CredFlow {
protected:
    void SetUp() override {
        CredFlow::SetUp();
        addCred("node_cred", "n1", "c1", "https", remote.port(), "s1");
        remote.answer(
            "test_connection",
            R"({"success":true,"data":{"addr":"192.0.2.1","protocol":"https","port":5001}})");
        remote.answer("create", R"({"success":true,"data":{"src_cred":{"cred_id":"r1"}}})");
        remote.answer("temp_create", R"({"success":true,"data":{"cred_id":"t1"}})");
        for (const char *call : {"create", "temp_create", "test_create"}) {
            remote.before(call, [this, call] { noteSession(call); });
        }
        users.add("OVRA.Core.User", 1, "get", OvraPlatform::APIRight::kAdministrator,
                  OvraPlatform::APIQueue::kQuick,
                  [](const Json::Value &params, const OvraPlatform::APICaller &) {
                      return params["name"] == "joe" ? OvraPlatform::apiSuccess()
                                                     : OvraPlatform::apiError(1);
                  });
        users.host();
    }
    /// What the temporary session permitted while the remote had it.
    void noteSession(const std::string &call) {
        Json::Value params;
        EXPECT_TRUE(OvraDRCore::fromString(params, remote.params(call)));
        lent = params["session"].asString();
        lentUser = NodeSession().GetUserBySession(lent);
    }
    bool isGone() { return !lent.empty() && NodeSession().GetUserBySession(lent).empty(); }
    bool arm(CredReverseCreate &flow, const std::string &account = "joe") {
        return flow.setCredId("c1") && flow.setLocalAccount(account) &&
               flow.addLocalConns({Conn::https("192.0.2.1", 5001), Conn::http("192.0.2.1", 5000)});
    }

    OvraPlatform::APIRegistry users;
    std::string lent;
    std::string lentUser;
};

} // namespace

TEST_F(ReverseCreation, TheRemoteGetsAnEndpointItReachesAndASessionForTheTimeOfTheCall) {
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    EXPECT_TRUE(flow.process());
    EXPECT_EQ(OvraDRCore::toString(flow.getCredInfo()), R"({"cred_id":"r1"})");
    EXPECT_EQ(lentUser, "joe");
    EXPECT_TRUE(isGone());
    Json::Value params;
    EXPECT_TRUE(OvraDRCore::fromString(params, remote.params("create")));
    EXPECT_EQ(params["conn"], Conn::https("192.0.2.1", 5001).toJson());
    EXPECT_EQ(params["auth"].asString() + params["cred_direction"].asString(),
              "sessionunidirection");
}

TEST_F(ReverseCreation, ATemporaryOneKeepsTheWholeAnswer) {
    TempCredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    EXPECT_TRUE(flow.process());
    EXPECT_EQ(OvraDRCore::toString(flow.getCredInfo()), R"({"cred_id":"t1"})");
    EXPECT_TRUE(isGone());
}

TEST_F(ReverseCreation, ACheckStoresNothing) {
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    flow.setCredInfo("kept");
    EXPECT_TRUE(flow.check());
    EXPECT_EQ(flow.getCredInfo().asString(), "kept");
    EXPECT_EQ(sent("s1 create"), 0);
    EXPECT_TRUE(isGone());
    remote.answer("test_create", R"({"success":false,"error":{"code":106,"msg":"why"}})");
    EXPECT_FALSE(flow.check());
    EXPECT_EQ(flow.GetErrCode(), 106);
    EXPECT_EQ(flow.GetErrMsg().asString(), "why");
}

TEST_F(ReverseCreation, AFailedCallStillTakesTheSessionBack) {
    remote.answer("create", R"({"success":false,"error":{"code":999}})");
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    EXPECT_FALSE(flow.process());
    EXPECT_EQ(flow.GetErrCode(), 999);
    EXPECT_TRUE(flow.getCredInfo().isNull());
    EXPECT_TRUE(isGone());
}

TEST_F(ReverseCreation, WhatCannotWorkEndsBeforeASessionIsGranted) {
    const struct {
        const char *answer;
        int code;
    } cases[] = {
        {R"({"success":false,"error":{"code":999}})", 999},
        {R"({"success":true,"data":{}})", 522},
        {R"({"success":true,"data":{"addr":"h","protocol":"ftp","port":21}})", 522},
    };
    for (const auto &each : cases) {
        remote.answer("test_connection", each.answer);
        CredReverseCreate flow;
        ASSERT_TRUE(arm(flow));
        EXPECT_FALSE(flow.process());
        EXPECT_EQ(flow.GetErrCode(), each.code);
    }
    EXPECT_EQ(lent, "");
    remote.forgetCalls();
    CredReverseCreate noEndpoint;
    EXPECT_TRUE(noEndpoint.setCredId("c1") && noEndpoint.setLocalAccount("joe") &&
                noEndpoint.addLocalConns({}));
    EXPECT_FALSE(noEndpoint.process());
    EXPECT_EQ(noEndpoint.GetErrCode(), 401);
    EXPECT_FALSE(noEndpoint.addLocalConns({Conn::https("a", 1), Conn(), Conn::https("b", 1)}));
    EXPECT_FALSE(noEndpoint.setCredId("") || noEndpoint.setCredId("c9") ||
                 noEndpoint.setLocalAccount(""));
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(ReverseCreation, AnAccountThatIsNotThereGetsNoSession) {
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow, "nobody"));
    EXPECT_FALSE(flow.process());
    EXPECT_EQ(flow.GetErrCode(), 527);
    EXPECT_EQ(sent("s1 create"), 0);
}
