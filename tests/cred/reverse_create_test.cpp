// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

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

    lent.clear();
    TempCredReverseCreate temporary;
    ASSERT_TRUE(arm(temporary));
    EXPECT_TRUE(temporary.process());
    EXPECT_EQ(OvraDRCore::toString(temporary.getCredInfo()), R"({"cred_id":"t1"})") << "all of it";
    EXPECT_TRUE(isGone());
    remote.answer("create", R"({"success":false,"error":{"code":999}})");
    lent.clear();
    EXPECT_EQ(codeOf(flow.process(), flow), 999);
    EXPECT_TRUE(isGone()) << "after a failure, too";
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
    EXPECT_EQ(codeOf(flow.check(), flow), 106);
    EXPECT_EQ(flow.GetErrMsg().asString(), "why");
}

TEST_F(ReverseCreation, WhatCannotWorkEndsBeforeASessionIsGranted) {
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    for (const auto &[answer, code] :
         {std::pair(R"({"success":false,"error":{"code":999}})", 999),
          {R"({"success":true,"data":{}})", 522},
          {R"({"success":true,"data":{"addr":"h","protocol":"ftp","port":21}})", 522}}) {
        remote.answer("test_connection", answer);
        EXPECT_EQ(codeOf(flow.process(), flow), code);
    }
    arrangeWayBack();
    ASSERT_TRUE(arm(flow, "nobody"));
    EXPECT_EQ(codeOf(flow.process(), flow), 527) << "an account that is not there";
    EXPECT_TRUE(flow.getCredInfo().isNull());
    EXPECT_EQ(lent, "");
    remote.forgetCalls();
    CredReverseCreate noEndpoint;
    EXPECT_TRUE(noEndpoint.setCredId("c1") && noEndpoint.setLocalAccount("joe") &&
                noEndpoint.addLocalConns({}));
    EXPECT_EQ(codeOf(noEndpoint.process(), noEndpoint), 401);
    EXPECT_FALSE(noEndpoint.addLocalConns({Conn::https("a", 1), Conn(), Conn::https("b", 1)}));
    EXPECT_FALSE(noEndpoint.setCredId("") || noEndpoint.setCredId("c9") ||
                 noEndpoint.setLocalAccount(""));
    EXPECT_EQ(remote.calls(), "");
}
