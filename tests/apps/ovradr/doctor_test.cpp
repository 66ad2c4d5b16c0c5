// SPDX-License-Identifier: Apache-2.0
// The program's diagnosis of a paired node with scripted failures.
#include "scripted_node.h"

#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <sstream>

namespace OvradrTest {

namespace {

using OvraTest::RemoteNode;

class Diagnosis : public ScriptedNode {
protected:
    static void pair(RemoteNode &node) {
        admitBob(node);
        EXPECT_EQ(logIn(node, {"cred", "create", urlOf(node)}).exit, 0);
    }
};

/// The first step that failed.
std::string failedStep(const Json::Value &document) {
    for (const Json::Value &step : document["data"]["examinations"][0]["steps"]) {
        if (step["state"] == "failed") {
            return step["step"].asString();
        }
    }
    return "";
}

} // namespace

TEST_F(Diagnosis, NamesTheStepThatFailsAndHasAnExitCodeForEach) {
    const std::tuple<const char *, int, std::function<void(RemoteNode &)>> cases[] = {
        {"", 0, [](RemoteNode &) {}},
        {"connect", 3, [](RemoteNode &node) { node.die(); }},
        {"key", 3, [](RemoteNode &node) { node.server.fallSilent(); }},
        {"key", 6, [](RemoteNode &node) { node.server.changeCertificate(); }},
        {"answer", 11,
         [](RemoteNode &node) { node.answer("probe", OvraTest::Answer::status(404)); }},
        {"session", 4, [](RemoteNode &node) { node.answer("info", refusal(119)); }},
        {"identity", 12,
         [](RemoteNode &node) { node.answer("info", success(R"({"node_id":"stranger"})")); }},
        {"right", 8, [](RemoteNode &node) { node.answer("test_privilege", refusal(105)); }},
        {"clock", 13,
         [](RemoteNode &node) { node.answer("getinfo", success(R"({"time":1600000000000})")); }},
    };
    for (const auto &[step, exit, harm] : cases) {
        OvraTest::executeSql("DELETE FROM node_cred");
        RemoteNode node;
        pair(node);
        harm(node);
        node.server.closeConnections();
        const Result result = run({"doctor", "n1", "--json"});
        EXPECT_EQ(result.exit, exit) << step << result.out;
        EXPECT_EQ(failedStep(result.json()), step) << result.out;
        EXPECT_EQ(result.out.find("ovradr cred set ") != std::string::npos, exit == 4);
        if (exit == 3 && std::string_view(step) == "key") {
            continue; // it waits 10 seconds for the key each time
        }
        const Result shown = run({"doctor", "n1"});
        EXPECT_EQ(shown.exit, exit);
        EXPECT_NE(shown.out.find("resolve"), std::string::npos) << "also where it failed";
        EXPECT_EQ((result.out + shown.out).find("s3cret"), std::string::npos);
    }
    EXPECT_EQ(run({"doctor", "https://no-such-host.invalid"}).exit, 10);
}

TEST_F(Diagnosis, KnowsWhatANodeThatIsGoneSaidLast) {
    pair(remote);
    const auto why = [] { return run({"why", "n1", "--json"}).json()["data"]["candidates"][0]; };
    EXPECT_EQ(run({"node", "info", "n1", "--refresh"}).exit, 0);
    EXPECT_EQ(why()["reason"], "its node answered over it last");
    remote.die();
    EXPECT_EQ(run({"node", "info", "n1", "--refresh"}).exit, 3);
    const Json::Value info = run({"node", "info", "n1", "--json"}).json()["data"];
    EXPECT_EQ(info["info"]["hostname"], "far-host");
    EXPECT_EQ(info["reachable"], false);
    EXPECT_EQ(why()["outlook"], "unreachable");
    EXPECT_EQ(why()["reason"], "its endpoint did not answer");
    const Json::Value nodes = run({"node", "list", "--json"}).json()["data"]["nodes"];
    ASSERT_EQ(nodes.size(), 2U);
    EXPECT_TRUE(nodes[0]["local"].asBool());
    EXPECT_EQ(nodes[1]["hostname"], "far-host");
    EXPECT_TRUE(nodes[1]["cred_id"].isNull()) << "no credential would be used";
    EXPECT_EQ(run({"why", "n1"}).out.find("right"), std::string::npos) << "nobody spoke of it";
}

TEST_F(Diagnosis, OfTheApplianceSeesWhatItsDaemonWouldNotServeWith) {
    const std::string etc = "/usr/ovra/etc/ovradr/";
    const auto blocked = [] { // the files of the caches are larger
        std::signal(SIGXFSZ, SIG_IGN);
        const rlimit small{65536, 65536};
        setrlimit(RLIMIT_FSIZE, &small);
    };
    const std::tuple<const char *, std::string, std::function<void()>> cases[] = {
        {"settings", "ovradrd does not start with it",
         [&] { writeFile(etc + "ovradrd.conf", "https_port=\"x\"\n"); }},
        {"keys", "chmod 600", [&] { chmod((etc + "ovradrd.seal").c_str(), 0644); }},
        {"keys", "ovradr setup", [&] { std::filesystem::remove(etc + "ovradrd.seal"); }},
        {"cache", "takes no entry", [] { std::filesystem::remove_all("/tmp/.ovradrcache"); }},
        {"daemon", "Start ovradrd", [] {}},
    };
    for (const auto &[step, told, harm] : cases) {
        std::filesystem::remove(etc + "ovradrd.conf");
        EXPECT_EQ(run({"setup"}).exit, 0);
        harm();
        const bool full = std::string_view(step) == "cache";
        const Result result = run(
            {"doctor", "--json"}, "", full ? std::function<void()>(blocked) : [] {});
        EXPECT_EQ(failedStep(result.json()), step) << result.out;
        EXPECT_NE(result.out.find(told), std::string::npos) << result.out;
        chmod((etc + "ovradrd.seal").c_str(), 0600);
    }
    Terminal shown({"doctor"});
    EXPECT_EQ(shown.finish(), 3);
    EXPECT_EQ(shown.screen().find("ovradr: "), std::string::npos) << "it is above already";
}

TEST_F(Diagnosis, FitsTheTerminalUnlessItMayBeWide) {
    for (const bool wide : {false, true}) {
        Terminal terminal(Arguments{"doctor", "https://no-such-host.invalid"} +
                          (wide ? Arguments{"--wide"} : Arguments{}));
        EXPECT_EQ(terminal.finish(), 10);
        std::istringstream lines(terminal.screen());
        std::size_t longest = 0;
        for (std::string line; std::getline(lines, line) && line.find("ovradr: ") != 0;) {
            longest = std::max(longest, line.find_last_not_of('\r') + 1);
        }
        EXPECT_EQ(longest > 80, wide) << terminal.screen();
    }
}

} // namespace OvradrTest
