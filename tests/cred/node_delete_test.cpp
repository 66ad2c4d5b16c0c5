// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrnode/cred_utils.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_delete.h>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

class CredDeletion : public CredFlow {
protected:
    CredDeletion() {
        addNodeCred("c1", "shared");
        addNodeCred("c2", "shared");
        addNodeCred("c3", "own");
        addCred("temp_cred", "n1", "t1", "https", remote.port(), "own");
    }
    bool remove(const std::string &credId) {
        remote.forgetCalls();
        log.clear();
        return DRNodeCredDelete(credId).process();
    }
};

} // namespace

TEST_F(CredDeletion, ASharedSessionGoesWithTheLastCredentialThatUsesIt) {
    EXPECT_TRUE(remove("c1"));
    EXPECT_EQ(sent("shared delete"), 0);
    EXPECT_EQ(log.count("INFO", "cred_utils", "NotifyRemoteNodeDeleteSessionIfNotUsed",
                        "session is used by other cred, not notify remote to delete"),
              1);
    EXPECT_TRUE(remove("c2"));
    EXPECT_EQ(sent("shared delete"), 1);
    EXPECT_EQ(remote.params("delete"), R"({"session":"shared"})");
    EXPECT_TRUE(remove("c3")) << "a temporary credential keeps no session alive";
    EXPECT_EQ(sent("own delete"), 1);
}

TEST_F(CredDeletion, TheRowGoesFirstAndStaysGoneWhateverTheRemoteSays) {
    std::string seen;
    remote.before("delete", [&] { seen = querySql("SELECT cred_id FROM node_cred"); });
    remote.answer("delete", R"({"success":false,"error":{"code":105}})");
    EXPECT_TRUE(remove("c3"));
    EXPECT_EQ(seen, "c1\nc2\n");
    EXPECT_EQ(log.count("WARN", "node_delete", "process",
                        "Failed to notify remote [{\"addr\":\"127.0.0.1\",\"port\":" +
                            std::to_string(remote.port()) +
                            ",\"protocol\":\"https\"}] to delete session"),
              1);
    remote.die();
    EXPECT_TRUE(remove("c1"));
    EXPECT_TRUE(remove("c2"));
    EXPECT_EQ(rows("node_cred"), "");
}

TEST_F(CredDeletion, TheNodeInformationIsRefreshedAndGoesWithTheLastCredential) {
    executeSql("DELETE FROM temp_cred");
    remove("c1");
    EXPECT_EQ(NodeCache("n1", false).GetCachedData()["hostname"].asString(), "b");
    remove("c2");
    EXPECT_FALSE(NodeCache("n1", false).GetCachedData().isNull());
    remove("c3");
    EXPECT_TRUE(NodeCache("n1", false).GetCachedData().isNull());
}

TEST_F(CredDeletion, ATemporaryOneGoesInTheSameWay) {
    EXPECT_EQ(CredUtils::GetSessionUsedCount("shared"), 2);
    EXPECT_EQ(CredUtils::GetSessionUsedCount("shared", "c1"), 1);
    EXPECT_EQ(CredUtils::GetSessionUsedCount("own"), 1) << "temporary ones do not count";
    NodeCache("n1", false).UpdateWithData("stored");
    EXPECT_TRUE(TempCredDelete("t1").process());
    EXPECT_EQ(rows("temp_cred"), "");
    EXPECT_EQ(remote.calls(), "") << "a node credential uses the session";
    EXPECT_EQ(NodeCache("n1", false).GetCachedData().asString(), "stored");

    executeSql("DELETE FROM node_cred");
    addCred("temp_cred", "n1", "t2", "https", remote.port(), "own");
    addCred("temp_cred", "n1", "no session", "https", remote.port(), "");
    EXPECT_TRUE(TempCredDelete("no session").process()) << "a record that is not valid goes too";
    remote.answer("own delete", R"({"success":false,"error":{"code":105}})");
    EXPECT_TRUE(TempCredDelete("t2").process());
    EXPECT_EQ(sent("own delete"), 1);
    EXPECT_EQ(rows("temp_cred"), "");
    EXPECT_TRUE(NodeCache("n1", false).GetCachedData().isNull());

    EXPECT_FALSE(TempCredDelete("").process());
    executeSql("DROP TABLE temp_cred");
    EXPECT_FALSE(TempCredDelete("t1").process());
}

TEST_F(CredDeletion, WhatIsUnknownOrDeadNeedsNoReleaseAndWhatCannotBeReadGetsNone) {
    EXPECT_TRUE(remove("c9"));
    EXPECT_EQ(log.count("WARN", "node_delete", "process", "Failed to get cred[c9] from db"), 1);
    EXPECT_EQ(log.count("Invalid session to notify remote delete"), 1);
    EXPECT_FALSE(remove(""));
    EXPECT_TRUE(CredUtils::TestSessionValid(conn, "own"));
    EXPECT_FALSE(CredUtils::TestSessionValid(conn, "") ||
                 CredUtils::TestSessionValid(Conn(), "own") ||
                 CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(Conn(), "own"));
    remote.answer("own test_privilege", R"({"success":false,"error":{"code":119}})");
    EXPECT_TRUE(remove("c3"));
    EXPECT_EQ(log.count("session has been invalid, no need to delete"), 1);
    EXPECT_EQ(sent("own delete"), 0);
    remote.forgetAnswers();
    executeSql("DROP TABLE node_cred");
    EXPECT_FALSE(remove("c1"));
    EXPECT_FALSE(CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(conn, "own"))
        << "what cannot be counted is not released";
    EXPECT_EQ(CredUtils::GetSessionUsedCount("own"), -1);
    EXPECT_EQ(CredUtils::GetSessionUsedCount(""), -1);
    EXPECT_EQ(remote.calls(), "");
}
