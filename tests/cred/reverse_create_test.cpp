// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrcore/json.h>
#include <ovradrnode/cred_reverse_create.h>

using namespace OvraDRNode;
using namespace OvraTest;

TEST_F(ReverseCreation, TheRemoteGetsAnEndpointItReachesAndASessionForTheTimeOfTheCall) {
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    EXPECT_TRUE(flow.process());
    EXPECT_EQ(OvraDRCore::toString(flow.getCredInfo()), R"({"cred_id":"r1"})");
    EXPECT_EQ(lentUser, "joe");
    EXPECT_EQ(lentSeconds, 300) << "should this process die";
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
