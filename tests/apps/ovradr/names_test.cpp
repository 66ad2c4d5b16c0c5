// SPDX-License-Identifier: Apache-2.0
#include "scripted_node.h"

#include <ovradrnode/node_cache.h>
#include <ovraplatform/session_store.h>

namespace OvradrTest {

namespace {

using OvraTest::addCred;

/// The nodes n1-one and n2-two, both of them "nas", and n3-three that only has a session here.
class Names : public testing::Test {
protected:
    Names() {
        EXPECT_EQ(run({"setup", "--hostname", "here"}).exit, 0);
        for (const char *id : {"n1-one", "n2-two"}) {
            addCred("node_cred", id, std::string("c-") + id, "https", 1, "s3cret");
            Json::Value info;
            info["hostname"] = "nas";
            OvraDRNode::NodeCache(id, false).UpdateWithData(info);
        }
        OvraPlatform::SessionRequest request;
        request.user = "repl";
        request.app = "Tidewater";
        request.extra = R"({"node_id":"n3-three"})";
        request.timeout = -1;
        EXPECT_TRUE(OvraPlatform::SessionStore().create(request));
    }

    /// The node that NODE means; the exit code where it means none.
    static std::string meant(const std::string &node) {
        const Result result = run({"attr", "set", node, "app", "k", "v", "--json"});
        const Json::Value id = result.json()["data"]["node_id"];
        return id.isString() ? id.asString() : std::to_string(result.exit);
    }
};

} // namespace

TEST_F(Names, StandForANodeWhereverTheyMeanOneAlone) {
    EXPECT_EQ(run({"node", "name", "n1", "Basement"}).exit, 0);
    EXPECT_EQ(run({"node", "name", "n3", "guest"}).exit, 0);
    const std::string local = meant("local");
    const std::pair<const char *, std::string> scenes[] = {
        {"n1", "n1-one"},       {"Basement", "n1-one"},
        {"basement", "n1-one"}, {"n2-two", "n2-two"},
        {"HERE", local},        {"n", "2"},
        {"nas", "2"},           {"base", "7"},
        {"guest", "7"},         {"", "7"},
    };
    for (const auto &[node, id] : scenes) {
        EXPECT_EQ(meant(node), id) << node;
    }
    EXPECT_EQ(local.size(), 36U);
    const Result two = run({"why", "nas"});
    EXPECT_NE(two.err.find("n1-one (Basement), n2-two (nas)"), std::string::npos) << two.err;
    // A peer chooses its own names: none of them takes the place of another node's id.
    EXPECT_EQ(run({"node", "name", "n1", "n2"}).exit, 0);
    EXPECT_EQ(meant("n2"), "2");
    EXPECT_NE(run({"why", "guest"}).err.find("No credential reaches the node n3-three"),
              std::string::npos);
    const std::pair<const char *, const char *> mistyped[] = {
        {"n2-tow", "Did you mean \"n2-two\"?"},
        {"nass", "Did you mean \"nas\"?"},
        {"n1x-one", "Did you mean \"n1-one\"?"},
        {"elsewhere", "There is no node"}};
    for (const auto &[node, said] : mistyped) {
        EXPECT_NE(run({"why", node}).err.find(said), std::string::npos) << node;
    }
    EXPECT_EQ(run({"why", "elsewhere"}).err.find("Did you mean"), std::string::npos);
}

TEST_F(Names, AreShownFirstAndRefusedWhereTheyMislead) {
    for (const char *bad : {"-x", "local", "LOCAL", "two words", "https://x", "\x1b[2J", "\xff"}) {
        EXPECT_EQ(run({"node", "name", "n1", "--", bad}).exit, 2) << bad;
    }
    EXPECT_EQ(run({"node", "name", "n1", "cellar"}).exit, 0);
    EXPECT_EQ(run({"node", "name", "n2", "Cellar"}).exit, 2) << "it is another node's";
    EXPECT_EQ(run({"node", "name", "n3", "guest"}).exit, 0);
    EXPECT_EQ(run({"node", "comment", "n3", "Ada's \x1b[2J"}).exit, 0);
    EXPECT_EQ(run({"node", "comment", "n1", std::string(256, 'x')}).exit, 2);
    const std::tuple<Arguments, const char *> tables[] = {
        {{"node", "list"}, "\ncellar  n1-one"},
        {{"cred", "list"}, "\ncellar  c-n1-one"},
        {{"session", "list"}, "\nguest  "},
        {{"session", "list", "--node", "Guest"}, "n3-three"},
        {{"status"}, "\nguest   n3-three  no credential"},
    };
    for (const auto &[command, shown] : tables) {
        EXPECT_NE(run(command).out.find(shown), std::string::npos) << run(command).out;
    }
    EXPECT_EQ(run({"status", "--json"}).json()["data"]["peers"][1]["comment"], "Ada's \x1b[2J");
    EXPECT_EQ(run({"node", "name", "cellar", ""}).exit, 0);
    EXPECT_EQ(run({"node", "name", "n2", "Cellar"}).exit, 0) << "it is free again";
}

} // namespace OvradrTest
