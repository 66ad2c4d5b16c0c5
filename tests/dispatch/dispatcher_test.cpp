// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"

#include <ovradrnode/operation_dispatcher.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

class Operation : public NodeOperationDispatcher {
public:
    using NodeOperationDispatcher::NodeOperationDispatcher;
    bool RunLocal() override {
        ++localRuns;
        return localResult;
    }
    OvraDRCore::Request GetRequest() override { return WebAPI::getDRNodeInfoAPI({}); }
    bool IsValidParam() override { return valid; }
    std::string GetCredId() const override { return credId; }

    bool valid = true;
    bool localResult = true;
    int localRuns = 0;
    std::string credId;
};

class Dispatch : public TwoNodes {
protected:
    Dispatch() {
        other.trust();
        addNodeCred("c1", "s1");
        addNodeCred("c2", "s2");
        addCred("node_cred", "n2", "c3", "https", other.port(), "s3");
        remote.answer("info", R"({"success":true,"data":{"hostname":"b"}})");
        other.answer("info", R"({"success":true,"data":{"hostname":"c"}})");
    }
    RemoteNode other; ///< "n2"
};

} // namespace

TEST_F(Dispatch, TheLocalNodeRunsHereAfterACheckOfTheParameters) {
    Operation operation(DRNode::getLocalNodeId());
    operation.valid = false;
    EXPECT_EQ(codeOf(operation.Run(), operation), 401);
    EXPECT_EQ(log.count("ERR", "operation_dispatcher", "Run", "Bad Parameter"), 1);
    EXPECT_EQ(operation.localRuns, 0);
    operation.valid = true;
    EXPECT_TRUE(operation.IsLocalNode() && operation.HasPrivilege() && !operation.IsRemoteNode());
    EXPECT_TRUE(operation.Run());
    EXPECT_EQ(operation.localRuns, 1);
    operation.localResult = false;
    EXPECT_FALSE(operation.Run()) << "its result is the result";
    operation.SetNodeId("n9");
    EXPECT_EQ(codeOf(operation.Run(), operation), 507) << "only known nodes are addressed";
    EXPECT_EQ(log.count("ERR", "operation_dispatcher", "Run", "Runner [n9] is not privilege node"),
              1);
    EXPECT_FALSE(Operation("").Run() || Operation("").IsRemoteNode());
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(Dispatch, ARemoteNodeIsAskedOverAnyCredentialAndTheOutcomeKept) {
    Operation operation("n1");
    EXPECT_TRUE(operation.Run());
    EXPECT_EQ(operation.GetResult()["hostname"].asString(), "b");
    EXPECT_EQ(operation.GetErrCode() + operation.localRuns, 0);
    Operation second("n2");
    EXPECT_TRUE(second.Run());
    EXPECT_EQ(second.GetResult()["hostname"].asString(), "c");
    EXPECT_EQ(remote.calls() + "; " + other.calls(),
              "probe, s1 test_privilege, s1 info; probe, s3 test_privilege, s3 info");
    remote.answer("info", R"({"success":false,"error":{"code":999,"msg":"why"}})");
    Operation refused("n1");
    EXPECT_EQ(codeOf(refused.Run(), refused), 999);
    EXPECT_EQ(refused.GetErrMsg().asString(), "why");
    EXPECT_TRUE(refused.GetResult().isNull());
    remote.die();
    Operation dead("n1");
    EXPECT_EQ(codeOf(dead.Run(), dead), 500) << "the sender's code comes first";
}

TEST_F(Dispatch, ANamedCredentialIsUsedAloneAndNeverAnotherNodes) {
    Operation operation("n1");
    operation.credId = "c2";
    EXPECT_TRUE(operation.Run());
    EXPECT_EQ(remote.calls(), "probe, s2 info");
    remote.forgetCalls();
    operation.credId = "c3";
    EXPECT_EQ(codeOf(operation.Run(), operation), 518);
    operation.credId = "c9";
    EXPECT_EQ(codeOf(operation.Run(), operation), 519);
    EXPECT_EQ(remote.calls(), "");
    operation.credId = "c2";
    remote.answer("info", R"({"success":false,"error":{"code":105}})");
    EXPECT_EQ(codeOf(operation.Run(), operation), 525);
    EXPECT_EQ(remote.calls(), "s2 info") << "no other credential is tried";
}
