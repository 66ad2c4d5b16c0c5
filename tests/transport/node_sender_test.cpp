// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"

#include <ovradrnode/cred_permission_cache.h>

#include <unistd.h>

using namespace OvraDRNode;
using namespace OvraTest;
using OvraDRCore::Response;

namespace {

constexpr const char *kNoPermission = R"({"success":false,"error":{"code":105}})";
constexpr const char *kOtherError = R"({"success":false,"error":{"code":999,"msg":"m"}})";

/// A node with the credentials c1, c2 (node) and t1 (temporary), all to one endpoint, with the
/// sessions s1, s2 and s3.
class NodeSend : public TwoNodes {
protected:
    NodeSend() {
        addNodeCred("c1", "s1");
        addNodeCred("c2", "s2");
        addCred("temp_cred", "n1", "t1", "https", remote.port(), "s3");
        ConnCache(conn).UpdateWithData(true);
    }
    void remember(const std::string &credId) { NodeValidCredCache("n1").UpdateWithData(credId); }
    std::string stored() { return NodeValidCredCache("n1").getStoredCredId(); }
    Response send() {
        remote.forgetCalls();
        return sender.process(info);
    }

    NodeSender sender{"n1"};
};

} // namespace

TEST_F(NodeSend, TheOrderOfAttempts) {
    const std::map<char, const char *> documents{
        {'.', R"({"success":true})"}, {'-', kNoPermission}, {'!', kOtherError}, {'?', "<html>"}};
    const struct {
        const char *what;
        const char *remembered;
        std::string answers; // to the sessions s1, s2 and s3
        const char *calls;
        int code; // of the response
        int senderCode;
        const char *after; // remembered afterwards
    } cases[] = {
        {"remembered works", "c2", "...", "s2 info", 0, 0, "c2"},
        {"remembered refused, not tried twice", "c2", ".-.", "s2 info, s1 info", 0, 0, "c1"},
        {"other error ends the search", "c2", ".!.", "s2 info", 999, 0, "c2"},
        {"refused, then success", "c1", "-..", "s1 info, s2 info", 0, 0, "c2"},
        {"temporary ones come last", "c1", "--.", "s1 info, s2 info, s3 info", 0, 0, "t1"},
        {"no reply goes on", "c1", "?..", "s1 info, s2 info", 0, 0, "c2"},
        {"the last answer counts", "c1", "---", "s1 info, s2 info, s3 info", 105, 525, "c1"},
        {"nothing usable remembered", "gone", "...", "s1 info", 0, 0, "c1"},
    };
    for (const auto &each : cases) {
        for (std::size_t i = 0; i < each.answers.size(); ++i) {
            remote.answer("s" + std::to_string(i + 1) + " info", documents.at(each.answers[i]));
        }
        remember(each.remembered);
        const Response response = send();
        EXPECT_EQ(remote.calls(), each.calls) << each.what;
        EXPECT_EQ(response.getErrCode(), each.code) << each.what;
        EXPECT_EQ(sender.GetErrCode(), each.senderCode) << each.what;
        EXPECT_EQ(stored(), each.after) << each.what;
    }
}

TEST_F(NodeSend, ADeadEndpointIsPassedOver) {
    const int dead = unusedPort();
    executeSql("UPDATE node_cred SET port = " + std::to_string(dead) + " WHERE cred_id = 'c1'");
    remember("c1");
    EXPECT_TRUE(send().isSuccess());
    EXPECT_EQ(remote.calls(), "s2 info");
    EXPECT_EQ(stored(), "c2");
    EXPECT_TRUE(sender.isConnectable());
    executeSql("UPDATE node_cred SET port = " + std::to_string(dead));
    executeSql("DELETE FROM temp_cred");
    for (const char *last : {"c1", "c2"}) {
        remember(last);
        EXPECT_EQ(codeOf(send().isValid(), sender), 500)
            << "the error of the last attempt, whichever that was";
    }
    EXPECT_FALSE(sender.isConnectable());
}

TEST_F(NodeSend, ARememberedCredentialWhoseRowCannotBeReadIsNotTakenForTried) {
    // The list has a blob that a look-up by text does not find, as if the row had been locked then.
    executeSql("DELETE FROM temp_cred; DELETE FROM node_cred WHERE cred_id <> 'c1';"
               "UPDATE node_cred SET cred_id = CAST(cred_id AS BLOB)");
    remember("c1");
    EXPECT_TRUE(send().isSuccess()) << sender.GetErrCode();
    EXPECT_EQ(remote.calls(), "s1 info");
}

TEST_F(NodeSend, WithNothingRememberedTheFirstWithTheRightIsFoundAndThenUsed) {
    remote.answer("s1 test_privilege", kNoPermission);
    EXPECT_TRUE(send().isSuccess());
    EXPECT_EQ(remote.calls(), "s1 test_privilege, s2 test_privilege, s2 info");
    EXPECT_TRUE(send().isSuccess());
    EXPECT_EQ(remote.calls(), "s2 info") << "one call with a remembered credential";
    EXPECT_FALSE(CredPermissionCache("c1").GetCachedHasPrivilege());
}

TEST_F(NodeSend, ANodeWithTemporaryCredentialsOnlyIsReachedAndAnUnknownOneIsNot) {
    executeSql("DELETE FROM node_cred");
    EXPECT_TRUE(send().isSuccess());
    EXPECT_EQ(sender.getValidCredId(), "") << "none of those is a valid one";
    EXPECT_FALSE(sender.isConnectable());
    NodeSender nobody("n9");
    EXPECT_EQ(codeOf(nobody.process(info).isValid(), nobody), 401);
    EXPECT_FALSE(nobody.isConnectable());
    EXPECT_FALSE(nobody.process(OvraDRCore::Request()).isValid());
    EXPECT_EQ(log.count("Bad api ["), 1);
    EXPECT_FALSE(NodeSender("").isValid());
}

TEST_F(NodeSend, TheLocalNodeNeedsNeitherDatabaseNorCache) {
    unlink(kNodeDatabase);
    host("OVRA.DR.Node", "info", [](const Json::Value &, const auto &) {
        Json::Value data;
        data["hostname"] = "here";
        return OvraPlatform::apiSuccess(data);
    });
    const std::string id = DRNode::getLocalNodeId();
    Json::Value out;
    EXPECT_TRUE(NodeSender::process(id, "OVRA.DR.Node", "info", 1, Json::Value(), out));
    EXPECT_EQ(out["hostname"].asString(), "here");
    CredNodeSender local(DRNode::getLocalNode());
    EXPECT_TRUE(local.process(info).isSuccess());
    EXPECT_TRUE(local.testPrivilege());
    EXPECT_EQ(local.GetErrCode(), 407) << "nothing was tested";
    EXPECT_TRUE(CredNodeSender::IsConnectable(DRNode::getLocalNode()));
    EXPECT_EQ(log.lines().size(), 0U);
}

TEST_F(NodeSend, OneNamedCredential) {
    DRNode node;
    Response response;
    EXPECT_EQ(codeOf(sender.processByCredId("", info, response), sender), 401);
    EXPECT_EQ(codeOf(sender.processByCredId("c9", info, response), sender), 404);
    EXPECT_EQ(codeOf(sender.processByCred(node, info, response), sender), 401);
    EXPECT_FALSE(CredNodeSender("c9").isValid());
    EXPECT_EQ(CredNodeSender("c9").GetErrCode(), 516);
    EXPECT_EQ(CredNodeSender("").GetErrCode(), 401);
    EXPECT_EQ(CredNodeSender("c1").GetErrCode(), 0);
    EXPECT_EQ(CredNodeSender(node).GetErrCode(), 516);
    CredNodeSender kept("c1");
    EXPECT_FALSE(kept.setCred("") || kept.setCred("c9") || kept.setCred(node));
    EXPECT_EQ(kept.getNode().credId, "c1") << "what was refused changed nothing";
    EXPECT_FALSE(sender.setNode("") || sender.setNode(node));
    EXPECT_TRUE(send().isSuccess());
}

TEST_F(NodeSend, TheRightIsAskedForAgainWhenTheVerdictHasExpired) {
    stopClock();
    ConnCache(conn).UpdateWithData(true);
    CredNodeSender cred("c1");
    EXPECT_TRUE(cred.testPrivilege());
    EXPECT_TRUE(cred.testPrivilege());
    EXPECT_EQ(remote.calls(), "s1 test_privilege");
    now += 3001;
    remote.answer("test_privilege", kNoPermission);
    EXPECT_EQ(codeOf(cred.testPrivilege(), cred), 525);
    now += 1000;
    ConnCache(conn).UpdateWithData(false);
    EXPECT_EQ(codeOf(cred.testPrivilege(), cred), 500);
}

TEST_F(NodeSend, ARelayedTestOfPrivilegeSaysNothingAboutTheCredentialThatCarriedIt) {
    CredPermissionCache permission("c1");
    EXPECT_TRUE(permission.SetHasPrivilege());
    remote.answer("relay", kNoPermission);
    CredNodeSender cred("c1");
    const Response refused =
        cred.process(WebAPI::getDRNodeCredRelayAPI("x", WebAPI::getDRNodeTestPrivilegeAPI()));
    EXPECT_EQ(refused.getErrCode(), 105);
    EXPECT_EQ(cred.GetErrCode(), 525);
    EXPECT_TRUE(permission.GetCachedHasPrivilege());
    EXPECT_EQ(log.count("NOTICE", "cred_permission_cache", "SetNoPrivilege",
                        "Not update no permission of credId[c1] in cache for relay test privilege "
                        "request"),
              1);
    EXPECT_TRUE(permission.SetPrivilege(info, false));
    EXPECT_FALSE(permission.GetCachedHasPrivilege());
    EXPECT_FALSE(CredPermissionCache("").SetHasPrivilege());
    EXPECT_TRUE(CredPermissionCache("new").GetCachedHasPrivilege());
    EXPECT_EQ(log.count("Set cred [c1] permission cache from [true] to [false]"), 1);
}
