// SPDX-License-Identifier: Apache-2.0
#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/other_process.h"

#include <ovradrcore/file_lock.h>
#include <ovradrcore/json.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/dr_node_attr.h>

#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <list>
#include <thread>

using namespace OvraDRNode;

namespace {

DRNode example() {
    DRNode node("n1", Conn::https("h", 5001), "s1");
    node.credId = "c1";
    return node;
}

std::string identityFile() {
    std::ifstream file(OvraTest::kIdentityFile);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writeIdentity(const std::string &text) {
    std::filesystem::create_directories("/usr/ovra/etc/ovradr");
    std::ofstream(OvraTest::kIdentityFile) << text;
}

} // namespace

TEST(DRNode, IsValidWithBothIdsAnEndpointAndASession) {
    EXPECT_TRUE(example().isValid());
    const std::function<void(DRNode &)> lacking[] = {
        [](DRNode &node) { node.session.clear(); }, [](DRNode &node) { node.conn.port = -1; },
        [](DRNode &node) { node.credId.clear(); }, [](DRNode &node) { node.nodeId.clear(); }};
    for (const auto &lack : lacking) {
        DRNode node = example();
        lack(node);
        EXPECT_FALSE(node.isValid()) << node.toJson();
    }
    EXPECT_FALSE(DRNode("x", "x").isValid()) << "equal ids that are not the local one";
    EXPECT_TRUE(DRNode::getLocalNode().isValid()) << "needs no endpoint and no session";
}

TEST(DRNode, SettersRefuseAndKeepTheOldValue) {
    LogCapture log;
    DRNode node = example();
    EXPECT_FALSE(node.setNodeId("") || node.setCredId("") || node.setConn(Conn()) ||
                 node.setSession(""));
    EXPECT_EQ(node.toJson(), example().toJson());
    EXPECT_EQ(node.session, "s1");
    EXPECT_EQ(log.count("ERR", "dr_node", "setNodeId", "Empty node id is not allowed."), 1);
    EXPECT_EQ(log.count("ERR", "dr_node", "setCredId", "Empty credId is not allowed."), 1);
    EXPECT_EQ(log.lines().size(), 2U);
}

TEST(DRNode, JsonNeverHoldsTheSessionAndGivesBackTheIdsOnly) {
    EXPECT_EQ(OvraDRCore::toString(example().toJson()),
              R"({"addr":"h","cred_id":"c1","node_id":"n1","port":5001,"protocol":"https"})");
    LogCapture log;
    DRNode node;
    EXPECT_TRUE(node.fromJson(example().toJson()));
    EXPECT_EQ(node.nodeId + node.credId, "n1c1");
    EXPECT_TRUE(node.conn == Conn()) << "the endpoint stays";
    EXPECT_EQ(log.lines().size(), 0U);
    Json::Value bad;
    bad["cred_id"] = 7;
    EXPECT_TRUE(node.fromJson(bad));
    EXPECT_EQ(node.credId, "c1");
    EXPECT_EQ(log.count("Bad Parameter to parse conn"), 1);
    EXPECT_TRUE(node.fromJson(Json::Value()));
    EXPECT_TRUE(node.fromJson(Json::Value(5)));
}

TEST(DRNodeAttr, NeedsNodeAppAndNameButNoValue) {
    EXPECT_TRUE(DRNodeAttr("n", "a", "k", "").isValid());
    EXPECT_FALSE(DRNodeAttr("n", "", "k", "v").isValid());
    EXPECT_EQ(OvraDRCore::toString(DRNodeAttr().toJson()),
              R"({"app":"","attr":"","node_id":"","value":""})");
}

TEST(Identity, IsMadeOnceAndKeptUntilAResetOfWhichThisProcessHearsNothing) {
    LogCapture log;
    EXPECT_TRUE(DRNode::resetLocalNodeId()) << "nothing to reset";
    const std::string id = DRNode::getLocalNodeId();
    EXPECT_EQ(id.size(), 36U);
    EXPECT_EQ(identityFile(), "node_id=\"" + id + "\"\n");
    EXPECT_EQ(DRNode::getLocalNodeId(), id);
    EXPECT_TRUE(DRNode::isLocalNodeId(id));
    EXPECT_FALSE(DRNode::isLocalNodeId(""));
    EXPECT_EQ(log.lines().size(), 0U);
    struct stat status {};
    stat("/usr/ovra/etc/ovradr", &status);
    EXPECT_EQ(status.st_mode & 07777U, 0755U);
    EXPECT_TRUE(DRNode::resetLocalNodeId());
    EXPECT_EQ(log.count("WARN", "dr_node", "resetLocalNodeId", "Reset local nodeId: [success]"), 1);
    EXPECT_NE(DRNode::getLocalNodeId(), id);
    EXPECT_TRUE(DRNode::isLocalNodeId(id));
}

TEST(Identity, AFileWithoutAUsableIdIsMended) {
    const std::array<const char *, 3> cases[] = {
        {"node_id=\"\"\n", "WARN", "Invalid nodeId []"},
        {"other=\"x\"\n", "ERR", "Failed to get nodeId"},
        {"", "ERR", "Failed to get nodeId"},
    };
    for (const auto &[text, level, message] : cases) {
        writeIdentity(text);
        LogCapture log;
        const std::string id = DRNode::getLocalNodeId();
        EXPECT_EQ(id.size(), 36U);
        EXPECT_EQ(log.count(level, "dr_node", "ReadNodeIdFromConf", message), 1);
        EXPECT_NE(identityFile().find("node_id=\"" + id + "\"\n"), std::string::npos);
    }
    EXPECT_EQ(DRNode::getLocalNodeId(), DRNode::getLocalNodeId());
}

TEST(Identity, ALockThatStaysHeldMeansNoIdAndNeverAWrongOne) {
    const std::string id = DRNode::getLocalNodeId();
    OvraDRCore::FileLock held("drnode.info.lock");
    ASSERT_TRUE(held.lock(LOCK_EX | LOCK_NB, 0));
    LogCapture log;
    EXPECT_EQ(DRNode::getLocalNodeId(), "");
    EXPECT_EQ(
        log.count("ERR", "dr_node", "ReadNodeIdFromConf", "Failed to lock [drnode.info.lock]"), 1);
    EXPECT_EQ(log.count("ERR", "dr_node", "CreateNodeId", "Failed to lock [drnode.info.lock]"), 1);
    EXPECT_EQ(log.count("ERR", "dr_node", "getLocalNodeId", "Failed to create nodeId"), 1);
    std::thread late([&held] {
        std::this_thread::sleep_for(
            std::chrono::milliseconds(6500)); // the reader gives up after 5 s
        held.unlock();
    });
    EXPECT_EQ(DRNode::getLocalNodeId(), id);
    late.join();
    EXPECT_EQ(identityFile(), "node_id=\"" + id + "\"\n");
}

TEST(Identity, ProcessesThatStartTogetherEndUpWithOneId) {
    std::list<OvraTest::OtherProcess> processes;
    for (int i = 0; i < 12; ++i) {
        processes.emplace_back([] { return DRNode::getLocalNodeId().size() == 36 ? 0 : 1; });
    }
    for (OvraTest::OtherProcess &each : processes) {
        EXPECT_EQ(each.wait(), 0);
    }
    const std::string id = DRNode::getLocalNodeId();
    EXPECT_EQ(identityFile(), "node_id=\"" + id + "\"\n") << "one line, whoever came last";
}

TEST(Identity, AFullOrReadOnlyPlaceGivesNoId) {
    writeIdentity("x");
    std::filesystem::remove_all("/usr/ovra/etc/ovradr");
    std::ofstream("/usr/ovra/etc/ovradr") << "a file where the folder should be";
    LogCapture log;
    EXPECT_EQ(DRNode::getLocalNodeId(), "");
    EXPECT_EQ(
        log.count("ERR", "dr_node", "CreateNodeId", "Failed to create dir [/usr/ovra/etc/ovradr]"),
        1);
}
