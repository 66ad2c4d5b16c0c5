// SPDX-License-Identifier: Apache-2.0
// The program's diagnosis of a paired node with scripted failures.
#include "program.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <gtest/gtest.h>

namespace OvradrTest {

namespace {

using OvraTest::Answer;
using OvraTest::RemoteNode;

constexpr const char *kSelf =
    R"({"success":true,"data":{"node_id":"far","serial":"S","hostname":"far-host"}})";

class PairedNode : public testing::Test {
protected:
    PairedNode() {
        EXPECT_EQ(run({"setup"}).exit, 0);
        pair(remote);
    }

    static void pair(RemoteNode &node) {
        node.answer("login", R"({"success":true,"data":{"sid":"login-session"}})");
        node.answer("info", kSelf);
        node.answer("create", R"({"success":true,"data":{"session":"s3cret"}})");
        const Result made =
            run({"cred", "create", "https://127.0.0.1:" + std::to_string(node.port()), "--account",
                 "bob", "--password-stdin", "--fingerprint", node.server.fingerprint()},
                "secret word\n");
        EXPECT_EQ(made.exit, 0) << made.err;
    }

    /// The first step that failed.
    static std::string failedStep(const Json::Value &document) {
        for (const Json::Value &step : document["data"]["examinations"][0]["steps"]) {
            if (step["state"] == "failed") {
                return step["step"].asString();
            }
        }
        return "";
    }

    RemoteNode remote;
};

} // namespace

TEST_F(PairedNode, TheDoctorNamesTheStepThatFailsAndHasAnExitCodeForEach) {
    const struct {
        const char *step;
        int exit;
        std::function<void(RemoteNode &)> harm;
    } cases[] = {
        {"", 0, [](RemoteNode &) {}},
        {"connect", 3, [](RemoteNode &node) { node.die(); }},
        {"key", 3,
         [](RemoteNode &node) {
             node.server.fallSilent();
             node.server.closeConnections();
         }},
        {"key", 6,
         [](RemoteNode &node) {
             node.server.changeCertificate();
             node.server.closeConnections();
         }},
        {"answer", 11, [](RemoteNode &node) { node.answer("probe", Answer::status(404)); }},
        {"session", 4,
         [](RemoteNode &node) {
             node.answer("info", R"({"success":false,"error":{"code":119}})");
         }},
        {"identity", 12,
         [](RemoteNode &node) {
             node.answer("info", R"({"success":true,"data":{"node_id":"stranger"}})");
         }},
        {"right", 8,
         [](RemoteNode &node) {
             node.answer("test_privilege", R"({"success":false,"error":{"code":105}})");
         }},
        {"clock", 13,
         [](RemoteNode &node) {
             node.answer("getinfo", R"({"success":true,"data":{"time":1600000000000}})");
         }},
    };
    for (const auto &each : cases) {
        OvraTest::executeSql("DELETE FROM node_cred");
        RemoteNode node;
        pair(node);
        each.harm(node);
        const Result result = run({"doctor", "far", "--json"});
        EXPECT_EQ(result.exit, each.exit) << each.step << result.out;
        EXPECT_EQ(failedStep(result.json()), each.step) << result.out;
        EXPECT_EQ(result.out.find("s3cret"), std::string::npos);
        const Result shown = run({"doctor", "far"});
        EXPECT_EQ(shown.exit, each.exit);
        EXPECT_NE(shown.out.find("resolve"), std::string::npos) << "also where it failed";
    }
    EXPECT_EQ(run({"doctor", "https://no-such-host.invalid"}).exit, 10);
}

TEST_F(PairedNode, ANewKeyGetsNoPassword) {
    RemoteNode stranger;
    const std::string url = "https://127.0.0.1:" + std::to_string(stranger.port());
    EXPECT_EQ(run({"doctor", url, "--account", "bob", "--password-stdin"}, "secret word\n").exit,
              6);
    EXPECT_EQ(run({"doctor", url}).exit, 0) << "what sends no secret needs no trust";
    EXPECT_EQ(stranger.calls().find("login"), std::string::npos) << stranger.calls();
    EXPECT_EQ(run({"conn", "forget", url}).exit, 7) << "and nothing was pinned";
}

TEST_F(PairedNode, WhatItSaidLastIsKeptWhenItIsGone) {
    EXPECT_EQ(run({"node", "info", "far", "--refresh"}).exit, 0);
    EXPECT_EQ(run({"why", "far", "--json"}).json()["data"]["candidates"][0]["reason"],
              "it worked last");
    remote.die();
    EXPECT_EQ(run({"node", "info", "far", "--refresh"}).exit, 3);
    const Json::Value info = run({"node", "info", "far", "--json"}).json()["data"];
    EXPECT_EQ(info["info"]["hostname"], "far-host");
    EXPECT_EQ(info["reachable"], false);
    remote.forgetCalls();
    const Json::Value why = run({"why", "far", "--json"}).json()["data"]["candidates"][0];
    EXPECT_EQ(why["outlook"], "unreachable");
    EXPECT_EQ(why["reason"], "its endpoint did not answer");
    const Json::Value nodes = run({"node", "list", "--json"}).json()["data"]["nodes"];
    ASSERT_EQ(nodes.size(), 2U);
    EXPECT_TRUE(nodes[0]["local"].asBool());
    EXPECT_EQ(nodes[1]["hostname"], "far-host");
    EXPECT_TRUE(nodes[1]["cred_id"].isNull()) << "no credential would be used";
}

} // namespace OvradrTest
