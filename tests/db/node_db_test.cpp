// SPDX-License-Identifier: Apache-2.0
#include "support/local_node.h"
#include "support/log_capture.h"

#include <ovradrnode/node_db.h>

#include <gtest/gtest.h>
#include <unistd.h>

using namespace OvraDRNode;
using OvraTest::addCred;
using OvraTest::querySql;

namespace {

class NodeDb : public testing::Test {
protected:
    void SetUp() override {
        OvraTest::provisionNode();
        DRNode::getLocalNodeId();
        addCred("node_cred", "n1", "c1", "https", 1, "s1");
        addCred("node_cred", "n1", "c2", "https", 2, "s2");
        addCred("node_cred", "n2", "c3", "http", 3, "s1");
        addCred("temp_cred", "n1", "t1", "https", 4, "s4");
        addCred("temp_cred", "n3", "t2", "https", 5, "s5");
        addCred("temp_cred", "n3", "t3", "https", 6, "s6");
    }

    LogCapture log;
};

/// The ids of the credentials of one node or of all.
std::string list(int tables, const char *nodeId = nullptr) {
    const auto type = static_cast<DRNodeDB::CredType>(tables);
    std::vector<DRNode> nodes;
    EXPECT_TRUE(nodeId != nullptr ? DRNodeDB::ListCred(nodeId, nodes, type)
                                  : DRNodeDB::List(nodes, type));
    std::string all;
    for (const DRNode &node : nodes) {
        all += node.credId + " ";
    }
    return all;
}

} // namespace

TEST_F(NodeDb, ListsTheTablesAskedForNodeCredentialsFirst) {
    EXPECT_EQ(list(1), "c1 c2 c3 ");
    EXPECT_EQ(list(2), "t1 t2 t3 ");
    EXPECT_EQ(list(3), "c1 c2 c3 t1 t2 t3 ");
    EXPECT_EQ(list(3, "n1"), "c1 c2 t1 ");
    EXPECT_EQ(list(1, "n3"), "");
    EXPECT_EQ(list(3, "n1' OR '1'='1"), "") << "an id is never SQL";
    std::vector<DRNode> nodes(1);
    EXPECT_FALSE(DRNodeDB::ListCred("", nodes, DRNodeDB::CRED_TYPE_NODE));
    EXPECT_EQ(log.count("ERR", "node_db", "ListCred", "Invalid nodeId []"), 1);
    EXPECT_TRUE(DRNodeDB::ListCred("n2", nodes, DRNodeDB::CRED_TYPE_NODE));
    EXPECT_EQ(nodes.size(), 2U) << "appended, never cleared";
}

TEST_F(NodeDb, AnUnreadableTableMeansFewerRecordsNotAFailure) {
    querySql("DROP TABLE temp_cred");
    EXPECT_EQ(list(3), "c1 c2 c3 ");
    EXPECT_EQ(
        log.count("ERR", "node_db", "ListRecords", "Failed to list cred from table [temp_cred]"),
        1);
}

TEST_F(NodeDb, FindsACredentialInEitherTableAndTheLocalNodeInNone) {
    DRNode node;
    EXPECT_TRUE(DRNodeDB::GetCred("c2", node));
    EXPECT_EQ(node.session, "s2");
    EXPECT_TRUE(node.conn == Conn::https("127.0.0.1", 2));
    EXPECT_TRUE(DRNodeDB::GetCred("t1", node));
    EXPECT_EQ(node.nodeId, "n1");
    EXPECT_FALSE(DRNodeDB::GetCred("c9", node));
    EXPECT_EQ(log.lines().size(), 0U);
    EXPECT_FALSE(DRNodeDB::GetCred("", node));
    EXPECT_EQ(log.count("ERR", "node_db", "GetCred", "Invalid credId []"), 1);
    unlink(OvraTest::kNodeDatabase);
    const std::string localId = DRNode::getLocalNodeId();
    EXPECT_TRUE(DRNodeDB::GetCred(localId, node)) << "needs no database";
    EXPECT_EQ(node.nodeId + node.credId, localId + localId);
    EXPECT_TRUE(DRNodeDB::Get(localId, node));
}

TEST_F(NodeDb, ARecordThatIsNotValidCountsAsNotFoundAndTheOtherTableIsSearched) {
    querySql("UPDATE node_cred SET session = '' WHERE cred_id = 'c1'");
    DRNode node;
    EXPECT_FALSE(DRNodeDB::GetCred("c1", node));
    addCred("temp_cred", "n1", "c1", "https", 7, "s7");
    EXPECT_TRUE(DRNodeDB::GetCred("c1", node));
    EXPECT_EQ(node.session, "s7");
    querySql("ALTER TABLE node_cred RENAME TO old; CREATE TABLE node_cred AS"
             " SELECT addr, protocol, port, cred_id, node_id, NULL AS session FROM old");
    EXPECT_FALSE(DRNodeDB::GetCred("c2", node)) << "not with the session of the record before";
}

TEST_F(NodeDb, TheFirstCredentialOfANodeOrTheIdAlone) {
    DRNode node;
    EXPECT_TRUE(DRNodeDB::Get("n1", node));
    EXPECT_EQ(node.credId, "c1");
    EXPECT_TRUE(DRNodeDB::Get("n3", node)) << "temporary credentials do not count";
    EXPECT_EQ(node.nodeId + node.credId + node.conn.addr + node.session, "n3");
    EXPECT_FALSE(DRNodeDB::Get("", node));
    EXPECT_EQ(log.count("ERR", "node_db", "Get", "Bad node Id[]"), 1);
}

TEST_F(NodeDb, CountsTheCredentialsOfANode) {
    EXPECT_EQ(DRNodeDB::IsNodeIdExist("n1"), 2);
    EXPECT_EQ(DRNodeDB::IsNodeIdExist("n3"), 2) << "temporary ones when there are no others";
    EXPECT_EQ(DRNodeDB::IsNodeIdExist("n9"), 0);
    EXPECT_EQ(DRNodeDB::IsNodeIdExist(DRNode::getLocalNodeId()), 0);
    EXPECT_EQ(DRNodeDB::IsNodeIdExist(""), -1);
    unlink(OvraTest::kNodeDatabase);
    EXPECT_EQ(DRNodeDB::IsNodeIdExist("n1"), -1);
}

TEST_F(NodeDb, PointsANodeCredentialElsewhereAndNoOther) {
    EXPECT_TRUE(DRNodeDB::SetConn("c1", Conn("alias", "flk", -1)));
    EXPECT_TRUE(DRNodeDB::SetConn("t1", Conn::https("x", 9))) << "no row matched";
    EXPECT_EQ(querySql("SELECT addr, protocol, port, session FROM node_cred WHERE cred_id='c1'"),
              "alias|flk|-1|s1\n");
    EXPECT_EQ(querySql("SELECT count(*) FROM temp_cred WHERE addr='x'"), "0\n");
    EXPECT_FALSE(DRNodeDB::SetConn("c1", Conn()));
    EXPECT_FALSE(DRNodeDB::SetConn("", Conn::https("x", 9)));
    EXPECT_EQ(log.count("ERR", "node_db", "SetConn", "invalid credId[c1] or conn"), 1);
    querySql("DROP TABLE node_cred");
    EXPECT_FALSE(DRNodeDB::SetConn("c1", Conn::https("x", 9)));
    EXPECT_EQ(log.count("ERR", "node_db", "SetConn", "Failed to update node"), 1);
}

TEST_F(NodeDb, DeletesTheNodeCredentialsOfOneNode) {
    EXPECT_TRUE(DRNodeDB::Delete("n1"));
    EXPECT_EQ(list(3), "c3 t1 t2 t3 ");
    EXPECT_TRUE(DRNodeDB::Delete("")) << "no row has an empty id";
    EXPECT_EQ(list(1), "c3 ");
    querySql("DROP TABLE node_cred");
    EXPECT_FALSE(DRNodeDB::Delete("n2"));
    EXPECT_EQ(log.count("ERR", "node_db", "Delete", "Failed to delete record of node [n2]"), 1);
}

TEST_F(NodeDb, AttributesAreKeptPerNodeAndApplication) {
    std::string value = "unset";
    EXPECT_FALSE(DRNodeDB::GetAttr("n1", "app", "k", value));
    EXPECT_EQ(log.count("ERR", "node_db", "GetAttr", "Failed to get attr[k]/app[app]/nodeId[n1]"),
              1);
    EXPECT_TRUE(DRNodeDB::SetAttr("n1", "app", "k", "it's one"));
    EXPECT_TRUE(DRNodeDB::SetAttr("n1", "app", "k", "two"));
    EXPECT_TRUE(DRNodeDB::SetAttr("n1", "app", "empty", ""));
    EXPECT_TRUE(DRNodeDB::SetAttr("n1", "other", "k", "x"));
    EXPECT_TRUE(DRNodeDB::GetAttr("n1", "app", "k", value));
    EXPECT_EQ(value, "two");
    EXPECT_TRUE(DRNodeDB::GetAttr("n1", "app", "empty", value));
    EXPECT_EQ(value, "");
    std::vector<DRNodeAttr> attrs;
    EXPECT_TRUE(DRNodeDB::ListAttr("n1", "app", attrs));
    ASSERT_EQ(attrs.size(), 2U);
    EXPECT_EQ(attrs[0].nodeId + attrs[0].app, "n1app");
    EXPECT_FALSE(DRNodeDB::ListAttr("", "app", attrs));
    EXPECT_FALSE(DRNodeDB::SetAttr("n1", "app", "", "v"));
    EXPECT_EQ(log.count("Failed to insert invalid attr["), 1);
    EXPECT_EQ(querySql("SELECT count(*) FROM node_attr"), "3\n");
    EXPECT_TRUE(DRNodeDB::SetAttr("n2", "app", "k", "far"));
    attrs.clear();
    EXPECT_TRUE(DRNodeDB::ListAppAttr("app", attrs));
    ASSERT_EQ(attrs.size(), 3U);
    EXPECT_EQ(attrs[2].nodeId + attrs[2].app + attrs[2].attr + attrs[2].value, "n2appkfar");
    EXPECT_FALSE(DRNodeDB::ListAppAttr("", attrs) || DRNodeDB::DeleteAttr("n1", "", "k"));
    EXPECT_TRUE(DRNodeDB::DeleteAttr("n1", "app", "k"));
    EXPECT_TRUE(DRNodeDB::DeleteAttr("n1", "app", "k")) << "there is none any more";
    EXPECT_EQ(querySql("SELECT node_id || app || attr FROM node_attr ORDER BY 1"),
              "n1appempty\nn1otherk\nn2appk\n");
}

TEST_F(NodeDb, TwoWritersOfANewAttributeBothSucceedAndOneValueStays) {
    // Both have found none and insert.
    querySql("INSERT INTO node_attr VALUES ('n1', 'app', 'k', 'first')");
    querySql("INSERT INTO node_attr VALUES ('n1', 'app', 'k', 'second')");
    std::string value;
    EXPECT_TRUE(DRNodeDB::GetAttr("n1", "app", "k", value));
    EXPECT_EQ(value, "second");
    EXPECT_TRUE(DRNodeDB::SetAttr("n1", "app", "k", "third"));
    EXPECT_EQ(querySql("SELECT value FROM node_attr"), "third\n");
}
