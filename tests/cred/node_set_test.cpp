// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_set.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

class CredUpdate : public CredFlow {
protected:
    CredUpdate() {
        addCred("node_cred", "n1", "c1", "http", 80, "old");
        addCred("node_cred", "n2", "c2", "https", 1, "other");
    }
    /// 0, or the code of the failure.
    int update(const std::string &credId = "c1") {
        DRNodeCredSet set(credId);
        return codeOf(set.setCred(conn, "joe", "pw", "1") && set.process(), set);
    }
    std::string row() {
        EXPECT_EQ(rows("node_cred WHERE cred_id = 'c2'"), "n2|https|1|other\n");
        return rows("node_cred WHERE cred_id = 'c1'");
    }

    const std::string untouched = "n1|http|80|old\n";
};

} // namespace

TEST_F(CredUpdate, TheRowIsRewrittenAndThenTheOldSessionReleasedOverTheNewEndpoint) {
    std::string seen;
    remote.before("delete", [&] { seen = row(); });
    EXPECT_EQ(update(), 0);
    EXPECT_EQ(row(), granted("granted"));
    EXPECT_EQ(seen, granted("granted"));
    EXPECT_EQ(remote.params("delete"), R"({"session":"old"})");
    EXPECT_EQ(sent("old delete"), 1);
    EXPECT_EQ(NodeCache("n1", false).GetCachedData()["hostname"], "b");
    EXPECT_TRUE(CredPermissionCache("c1").GetCachedData().isBool());
}

TEST_F(CredUpdate, TheSameSessionOverTheSameEndpointWritesAndReleasesNothing) {
    remote.answer("create", R"({"success":true,"data":{"session":"old"}})");
    EXPECT_EQ(update(), 0) << "a change of the endpoint alone";
    EXPECT_EQ(row(), granted("old"));
    log.clear();
    EXPECT_EQ(update(), 0);
    EXPECT_EQ(row(), granted("old"));
    EXPECT_EQ(log.count("INFO", "node_set", "setCredRecord",
                        "No change of conn or session of credId[n1]"),
              1);
    EXPECT_EQ(sent("old delete"), 0);
}

TEST_F(CredUpdate, FailsAtEachStepWithItsCodeAndTheOldRow) {
    const struct {
        const char *call;
        const char *answer;
        int code;
    } cases[] = {
        {"login", R"({"success":false,"error":{"code":403}})", 504},
        {"info", R"({"success":false,"error":{"code":999}})", 519},
        {"info", R"({"success":false,"error":{"code":105}})", 525},
        {"info", R"({"success":true,"data":{"node_id":"n1"}})", 519},
        {"info", R"({"success":true,"data":{"node_id":"n1","serial":""}})", 518},
        {"info", R"({"success":true,"data":{"node_id":"n2","serial":"S"}})", 518},
        {"create", R"({"success":false,"error":{"code":105}})", 509},
        {"create", R"({"success":true,"data":{}})", 509},
        {"granted test_privilege", R"({"success":false,"error":{"code":119}})", 509},
    };
    for (const auto &each : cases) {
        arrangeAnswers();
        remote.answer(each.call, each.answer);
        EXPECT_EQ(update(), each.code) << each.call << each.answer;
        EXPECT_EQ(row(), untouched);
    }
    DRNodeCredSet again("c1");
    ASSERT_TRUE(again.setCred(conn, "joe", "pw", "1"));
    EXPECT_FALSE(again.process());
    arrangeAnswers();
    EXPECT_TRUE(again.check()) << "the same object, once the node is well";
    EXPECT_EQ(again.GetErrCode(), 0);
    EXPECT_EQ(log.count("ERR", "node_set", "checkRemoteNodeInfo",
                        "Different nodeId [n2] to setCred, [n1] is expected"),
              1);
    EXPECT_EQ(sent("old delete") + sent("granted delete"), 0);
    EXPECT_NE(update("c9"), 0);
    EXPECT_EQ(DRNodeCredSet("c9").GetErrCode(), 404);
    EXPECT_EQ(DRNodeCredSet("").GetErrCode(), 401);
    remote.die();
    EXPECT_EQ(update(), 500);
}

TEST_F(CredUpdate, ARowThatCannotBeWrittenOffersTheNewSessionForRelease) {
    executeSql(
        "CREATE TRIGGER no BEFORE UPDATE ON node_cred BEGIN SELECT RAISE(FAIL, 'full'); END");
    EXPECT_EQ(update(), 404);
    EXPECT_EQ(row(), untouched);
    EXPECT_EQ(sent("granted delete"), 1);
    EXPECT_EQ(sent("old delete"), 0);
    EXPECT_EQ(log.count("ERR", "node_set", "process",
                        "Failed to set credId[c1], notify remote to delete new session"),
              1);
    EXPECT_EQ(log.count("'granted'"), 0);
}

TEST_F(CredUpdate, AReleaseThatFailsIsOnlyAWarningAndASessionThatAnotherCredentialUsesStays) {
    remote.answer("delete", R"({"success":false,"error":{"code":100}})");
    EXPECT_EQ(update(), 0);
    EXPECT_EQ(log.count("to delete not used session"), 1);
    executeSql("UPDATE node_cred SET session = 'old' WHERE cred_id = 'c1'");
    addNodeCred("c3", "old");
    remote.forgetCalls();
    EXPECT_EQ(update(), 0);
    EXPECT_EQ(sent("old delete"), 0);
}
