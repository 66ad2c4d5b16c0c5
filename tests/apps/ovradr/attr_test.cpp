// SPDX-License-Identifier: Apache-2.0
#include "program.h"
#include "support/local_node.h"

#include <gtest/gtest.h>

#include <list>

namespace OvradrTest {

TEST(Attributes, AreSetReadAndListedPerNodeAndApplication) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    OvraTest::addCred("node_cred", "n1-remote", "c1", "https", 1, "s1");
    EXPECT_EQ(run({"attr", "get", "n1", "app", "k"}).exit, 7);
    EXPECT_EQ(run({"attr", "list", "n1", "app", "--json"}).json()["data"]["attrs"].size(), 0U);
    EXPECT_EQ(run({"attr", "set", "n1", "app", "k", "it's 1"}).exit, 0);
    EXPECT_EQ(run({"attr", "set", "n1", "app", "empty", ""}).exit, 0);
    EXPECT_EQ(run({"attr", "set", "local", "app", "k", "\x1b[2J"}).exit, 0);
    EXPECT_EQ(run({"attr", "get", "n1", "app", "k"}).out, "it's 1\n");
    EXPECT_EQ(run({"attr", "get", "local", "app", "k"}).out, "\\x1b[2J\n");
    EXPECT_EQ(run({"attr", "list", "n1", "app"}).out, "ATTRIBUTE  VALUE\n"
                                                      "empty\n"
                                                      "k          it's 1\n");
    EXPECT_EQ(run({"attr", "get", "n1", "app", "k", "--json"}).json()["data"]["node_id"],
              "n1-remote");
    EXPECT_EQ(run({"attr", "unset", "n1", "app", "k"}).exit, 0);
    EXPECT_EQ(run({"attr", "unset", "n1", "app", "k"}).exit, 7);
    ASSERT_EQ(run({"attr", "set", "n1", "app", "k", "\xff\n"}).exit, 0);
    EXPECT_EQ(run({"attr", "get", "n1", "app", "k", "--raw"}).out, "\xff\n");
    const Json::Value data = run({"attr", "get", "n1", "app", "k", "--json"}).json()["data"];
    EXPECT_TRUE(data["value"].isNull() && data["base64"] == "/wo=") << data;
    EXPECT_EQ(run({"attr", "set", "n1", "", "k", "v"}).exit, 2);
    EXPECT_EQ(run({"attr", "set", "nowhere", "app", "k", "v"}).exit, 7);
}

TEST(Attributes, ManyWritersOfANewOneLeaveOneValue) {
    ASSERT_EQ(run({"setup"}).exit, 0);
    std::list<Program> writers;
    for (const char *value : {"0", "1", "2", "3", "4", "5"}) {
        writers.emplace_back(Arguments{"attr", "set", "local", "app", "k", value});
    }
    for (Program &writer : writers) {
        EXPECT_EQ(writer.finish().exit, 0);
    }
    EXPECT_EQ(run({"attr", "list", "local", "app", "--json"}).json()["data"]["attrs"].size(), 1U);
}

} // namespace OvradrTest
