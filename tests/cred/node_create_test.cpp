// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_create.h>

#include <regex>

using namespace OvraDRNode;
using namespace OvraTest;

TEST_F(CredFlow, CreatesFromAnAccountAndLogsOutAgain) {
    {
        DRNodeCredCreate create;
        ASSERT_TRUE(create.setCred(conn, "joe", "first", "123456"));
        ASSERT_TRUE(create.setCred(conn, "joe", "pw", "123456"));
        EXPECT_EQ(sent("login-sid logout"), 1) << "the first log-in is not left open";
        ASSERT_TRUE(create.process()) << OvraDRCore::toString(create.GetErr());
        EXPECT_EQ(create.getNode().nodeId, "n1");
        EXPECT_EQ(create.getNode().credId.size(), 36U);
    }
    EXPECT_EQ(rows("node_cred"), granted("granted"));
    EXPECT_EQ(rows("temp_cred"), "");
    EXPECT_TRUE(std::regex_match(
        remote.params("login"),
        std::regex(
            R"(\{"account":"joe",("device_token":".{43}",)?"otp_code":"123456","passwd":"pw"\})")))
        << remote.params("login");
    EXPECT_EQ(remote.params("create"), R"({"_hostname":")" + DRNode::getLocalHostName() +
                                           R"(","node_id":")" + DRNode::getLocalNodeId() + "\"}");
    EXPECT_EQ(sent("login-sid logout"), 2);
    EXPECT_GE(sent("granted test_privilege"), 1) << "the session was tried before it was stored";
    EXPECT_EQ(NodeCache("n1", false).GetCachedData()["hostname"].asString(), "b");
    TempCredCreate temporary;
    ASSERT_TRUE(temporary.setCred(conn, "joe", "pw", "") && temporary.process());
    EXPECT_EQ(rows("temp_cred"), granted("temp-granted"));
    EXPECT_EQ(rows("node_cred"), granted("granted"));
}

TEST_F(CredFlow, CreatesFromASessionAndFromAnotherCredential) {
    DRNodeCredCreate bySession;
    ASSERT_TRUE(bySession.setCred(conn, "caller's"));
    EXPECT_EQ(sent("caller's get"), 1);
    ASSERT_TRUE(bySession.process());
    DRNodeCredCreate byCred;
    ASSERT_TRUE(byCred.setCred(bySession.getNode().credId));
    ASSERT_TRUE(byCred.process());
    EXPECT_EQ(rows("node_cred"), granted("granted") + granted("granted"));
    EXPECT_NE(byCred.getNode().credId, bySession.getNode().credId);
    EXPECT_EQ(sent("login-sid logout") + sent("caller's delete"), 0) << "what was lent stays";
}

TEST_F(CredFlow, ACheckCreatesNothing) {
    DRNodeCredCreate create;
    ASSERT_TRUE(create.setCred(conn, "joe", "pw", ""));
    EXPECT_TRUE(create.check());
    EXPECT_EQ(remote.params("get"), R"({"name":"joe"})");
    remote.answer("get", R"({"success":false,"error":{"code":105}})");
    EXPECT_EQ(codeOf(create.check(), create), 525);
    EXPECT_EQ(log.count("ERR", "node_create", "check", "Failed to check cred account [joe]"), 1);
    EXPECT_EQ(rows("node_cred"), "");
    EXPECT_EQ(sent("login-sid create"), 0);
}

TEST_F(CredFlow, CreationFailsAtEachStepWithItsCodeAndWritesNothing) {
    const struct {
        const char *call;
        const char *answer;
        int code;
        bool asked; ///< for a session
    } cases[] = {
        {"info", R"({"success":false,"error":{"code":999}})", 999, false},
        {"info", R"({"success":false,"error":{"code":105}})", 525, false},
        {"info", R"({"success":true,"data":{"node_id":"n1"}})", 519, false},
        {"info", R"({"success":true,"data":{"serial":"S"}})", 519, false},
        {"info", R"({"success":true,"data":{"node_id":"n1","serial":""}})", 519, false},
        {"info", R"({"success":true,"data":{"node_id":{},"serial":"S"}})", 519, false},
        {"create", R"({"success":false,"error":{"code":105}})", 509, true},
        {"create", R"({"success":true,"data":{}})", 509, true},
        {"create", R"({"success":true,"data":{"session":""}})", 509, true},
        {"granted test_privilege", R"({"success":false,"error":{"code":119}})", 509, true},
    };
    for (const auto &each : cases) {
        arrangeAnswers();
        remote.answer(each.call, each.answer);
        remote.forgetCalls();
        DRNodeCredCreate create;
        ASSERT_TRUE(create.setCred(conn, "joe", "pw", ""));
        EXPECT_EQ(codeOf(create.process(), create), each.code) << each.answer;
        EXPECT_EQ(rows("node_cred"), "") << each.answer;
        EXPECT_EQ(sent("login-sid create"), each.asked ? 1 : 0) << each.answer;
        arrangeAnswers();
        EXPECT_TRUE(create.process()) << each.answer << ", and then again";
        EXPECT_EQ(create.GetErrCode(), 0);
        executeSql("DELETE FROM node_cred");
    }
    EXPECT_EQ(log.count("ERR", "node_create", "process",
                        "Failed to request session of remote node [127.0.0.1]"),
              4);
    DRNodeCredCreate create;
    ASSERT_TRUE(create.setCred(conn, "joe", "pw", ""));
    remote.before("test_privilege", [this] { remote.die(); });
    remote.answer("granted test_privilege", Answer::closed());
    EXPECT_EQ(codeOf(create.process(), create), 509) << "dead between grant and write";
    EXPECT_EQ(rows("node_cred"), "");
}

TEST_F(CredFlow, ANodeThatWasMetIsNotAskedAgainWhoItIs) {
    DRNodeCredCreate create;
    ASSERT_TRUE(create.setCred(conn, "joe", "pw", ""));
    EXPECT_EQ(codeOf(create.processKnownNode(), create), 519) << "no node was met";
    EXPECT_EQ(sent("login-sid create"), 0);
    ASSERT_TRUE(create.getRemoteNodeInfo());
    EXPECT_FALSE(create.isLocalNode());
    EXPECT_TRUE(create.processKnownNode()) << OvraDRCore::toString(create.GetErr());
    EXPECT_EQ(rows("node_cred"), granted("granted"));
    EXPECT_EQ(sent("login-sid info"), 1);
    EXPECT_EQ(NodeCache("n1", false).GetCachedData()["hostname"].asString(), "b");

    remote.answer("info", R"({"success":true,"data":{"serial":"S1","node_id":")" +
                              DRNode::getLocalNodeId() + R"("}})");
    ASSERT_TRUE(create.getRemoteNodeInfo());
    EXPECT_TRUE(create.isLocalNode());
    remote.answer("create", R"({"success":false,"error":{"code":105}})");
    EXPECT_EQ(codeOf(create.processKnownNode(), create), 509);
    EXPECT_EQ(log.count("ERR", "node_create", "processKnownNode",
                        "Failed to request session of remote node [127.0.0.1]"),
              1);
}

TEST_F(CredFlow, ARowThatCannotBeWrittenLeavesTheGrantedSessionOnTheRemote) {
    DRNodeCredCreate create;
    ASSERT_TRUE(create.setCred(conn, "joe", "pw", ""));
    querySql("DROP TABLE node_cred");
    EXPECT_EQ(codeOf(create.process(), create), 404);
    EXPECT_EQ(sent("granted delete"), 0);
    EXPECT_EQ(log.count("Failed to insert record [INSERT INTO \"node_cred\""), 1);
    EXPECT_EQ(log.count("granted'"), 0) << "the logged statement hides the session";
    EXPECT_EQ(log.count("ERR", "node_create", "process", "Failed to insert crednode to db"), 1);
}

TEST_F(CredFlow, SetUpRefusesWhatCannotWork) {
    DRNodeCredCreate create;
    EXPECT_EQ(codeOf(create.setCred(conn, "joe", "", "1"), create), 401);
    EXPECT_EQ(log.count("ERR", "node_create", "setCred",
                        "Bad Parameter: conn[" + OvraDRCore::toString(conn.toJson()) +
                            "]/account[joe]/password"),
              1);
    EXPECT_EQ(codeOf(create.setCred(conn, ""), create), 401);
    EXPECT_EQ(codeOf(create.setCred(""), create), 401);
    EXPECT_EQ(codeOf(create.setCred("no such"), create), 516);
    EXPECT_EQ(create.GetErrMsg().asString(), "no such");
    const Conn dead = Conn::https("127.0.0.1", unusedPort());
    EXPECT_EQ(codeOf(create.setCred(dead, "joe", "pw", ""), create), 500);
    EXPECT_FALSE(create.setConn(Conn()));
    EXPECT_EQ(create.GetErrMsg().asString(), "conn");
    EXPECT_FALSE(create.setSender(nullptr) || create.setCredSender(nullptr));
    EXPECT_EQ(create.GetErrCode(), 403);
    EXPECT_EQ(codeOf(create.process(), create), 401);
    EXPECT_EQ(create.GetErrMsg().asString(), "account");
    for (const char *answer :
         {R"({"success":true,"data":{}})", R"({"success":true,"data":{"account":""}})",
          R"({"success":false,"error":{"code":119}})"}) {
        remote.answer("get", answer);
        EXPECT_EQ(codeOf(create.setCred(conn, "caller's"), create), 528) << answer;
        EXPECT_TRUE(create.setCredAccount("joe"));
        EXPECT_EQ(codeOf(create.process(), create), 520) << "with the session of a failed set-up";
    }
    remote.answer("login", R"({"success":false,"error":{"code":404}})");
    DRNodeCredCreate loggedOut;
    EXPECT_EQ(codeOf(loggedOut.setCred(conn, "joe", "pw", "000000"), loggedOut), 505);
    EXPECT_EQ(codeOf(loggedOut.process(), loggedOut), 520);
    EXPECT_EQ(codeOf(loggedOut.checkCredAccount(), loggedOut), 520);
}
