// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "cgi/account_store.h"
#include "cgi/session_store.h"
#include "ovrawebapi/api_runner.h"
#include "support/local_node.h"

#include <filesystem>

namespace {

using OvraTest::Appliance;
using OvraTest::json;
using OvraTest::Reply;

struct Scene {
    const char *api;
    int version;
    const char *method;
    const char *params;
    int nobody; ///< codes for a caller without a session, a user, and an administrator
    int user;
    int administrator;
};

constexpr char kNode[] = "OVRA.DR.Node";
constexpr char kSession[] = "OVRA.DR.Node.Session";
constexpr char kUser[] = "OVRA.Core.User";
constexpr char kCredential[] = "OVRA.DR.Node.Credential";
constexpr char kOneEndpoint[] = R"({"conns":[{"addr":"127.0.0.1","protocol":"http","port":1}]})";

const Scene kScenes[] = {

    {"OVRA.None", 1, "get", "{}", 102, 102, 102},
    {kNode, 1, "none", "{}", 103, 103, 103},
    {kNode, 2, "info", "{}", 104, 104, 104},
    {"OVRA.Core.Auth", 2, "login", "{}", 104, 104, 104},
    {"OVRA.Core.Encryption", 1, "getinfo", "{}", 0, 0, 0},
    {kUser, 1, "get", R"({"name":"user"})", 119, 0, 0},
    {kUser, 1, "get", R"({"name":"root"})", 119, 105, 0},
    {kUser, 1, "get", R"({"name":"none"})", 119, 105, 106},
    {kUser, 1, "get", "{}", 119, 106, 106},
    {"OVRA.Core.Farlink", 1, "get", "{}", 119, 105, 105},
    {kNode, 1, "info", "{}", 119, 0, 0},
    {kNode, 1, "info", R"({"additional":"timezone"})", 119, 106, 106},
    {kNode, 1, "test_privilege", "{}", 119, 105, 0},
    {kNode, 1, "test_connection", kOneEndpoint, 119, 105, 500},
    {kNode, 1, "test_connection", "{}", 119, 105, 106},
    {kSession, 1, "create", R"({"node_id":"n1"})", 104, 104, 104},
    {kSession, 2, "create", R"({"node_id":"n1"})", 119, 105, 0},
    {kSession, 2, "create", R"({"node_id":""})", 119, 105, 106},
    {kSession, 1, "temp_create", "{}", 119, 105, 0},
    {kSession, 1, "get", R"({"session":"none"})", 119, 528, 528},
    {kSession, 1, "delete", R"({"session":"none"})", 119, 105, 0},
    {kSession, 1, "delete", "{}", 119, 105, 106},
    {kCredential, 1, "list", "{}", 119, 105, 0},
    {kCredential, 1, "create", "{}", 119, 105, 106},
    {kCredential, 1, "temp_create", "{}", 119, 105, 106},
    {kCredential, 1, "test_create", "{}", 119, 105, 106},
    {kCredential, 1, "set", "{}", 119, 105, 106},
    {kCredential, 1, "test_set", "{}", 119, 105, 106},
    {kCredential, 1, "get", R"({"cred_id":"none"})", 119, 105, 404},
    {kCredential, 1, "delete", "{}", 119, 105, 106},
    {kCredential, 1, "reverse_create", R"({"cred_id":"none"})", 119, 105, 404},
    {kCredential, 1, "test_reverse_create", R"({"cred_id":"none"})", 119, 105, 404},
    {kCredential, 1, "temp_reverse_create", R"({"cred_id":"none"})", 119, 105, 404},
    {kCredential, 1, "relay", R"({"cred_id":"none","webapi":{}})", 119, 105, 404}};

class Rights : public Appliance {};

TEST_F(Rights, areAskedForOfEveryCaller) {
    addAccount("user", false);
    addAccount("root", true);
    const std::string user = session("user");
    const std::string administrator = session("root");
    for (const Scene &scene : kScenes) {
        SCOPED_TRACE(std::string(scene.api) + " " + scene.method + " " + scene.params);
        const auto code = [&](const std::string &sid) {
            return call(scene.api, scene.version, scene.method, json(scene.params), sid).code();
        };
        EXPECT_EQ(code(""), scene.nobody);
        EXPECT_EQ(code("unknown-session"), scene.nobody);
        EXPECT_EQ(code(user), scene.user);
        EXPECT_EQ(code(administrator), scene.administrator);
    }
}

class Session : public Appliance {};

TEST_F(Session, isWorthWhatItsAccountIsWorthNow) {
    addAccount("alice", true);
    addAccount("root", true);
    const std::string sid = session("alice");
    OvraPlatform::AccountStore accounts;
    const auto code = [&] { return call(kNode, 1, "test_privilege", {}, sid).code(); };
    EXPECT_EQ(code(), 0);
    ASSERT_TRUE(accounts.setAdministrator("alice", false));
    EXPECT_EQ(code(), 105);
    ASSERT_TRUE(accounts.setAdministrator("alice", true));
    ASSERT_TRUE(accounts.setDisabled("alice", true));
    EXPECT_EQ(code(), 105);
    ASSERT_TRUE(accounts.remove("alice"));
    EXPECT_EQ(code(), 119);
}

TEST_F(Session, thatExpiredIsUnknown) {
    addAccount("alice", true);
    const std::string sid = session("alice", 1);
    EXPECT_EQ(call(kNode, 1, "info", {}, sid).code(), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(2100));
    EXPECT_EQ(call(kNode, 1, "info", {}, sid).code(), 119);
}

TEST_F(Session, isNotTakenForExpiredWhenTheStoreCannotBeRead) {
    addAccount("alice", true);
    const std::string sid = session("alice");
    for (int i = 0; i < 20; ++i) {
        ASSERT_EQ(call(kNode, 1, "info", {}, sid).code(), 0);
    }
    std::filesystem::resize_file(OvraPlatform::kSessionsFile, 10);
    for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(call(kNode, 1, "info", {}, sid).code(), 100);
    }
}

TEST_F(Session, isLookedUpInTheFileThatIsThereNow) {
    addAccount("alice", true);
    const std::string before = session("alice");
    for (int i = 0; i < 20; ++i) {
        ASSERT_EQ(call(kNode, 1, "info", {}, before).code(), 0);
    }
    std::filesystem::remove(OvraPlatform::kSessionsFile);
    const std::string after = session("alice");
    for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(call(kNode, 1, "info", {}, before).code(), 119);
        EXPECT_EQ(call(kNode, 1, "info", {}, after).code(), 0);
    }
}

TEST_F(Session, forANodeIsReusedAndTiedToTheCallersAccount) {
    addAccount("alice", true);
    const std::string sid = session("alice");
    const Json::Value node = json(R"({"node_id":"n1"})");
    const Reply first = call(kSession, 2, "create", node, sid);
    ASSERT_EQ(first.code(), 0) << first.text;
    EXPECT_EQ(call(kSession, 2, "create", node, sid).data(), first.data());
    const Reply owner = call(kSession, 1, "get", first.data(), sid);
    EXPECT_EQ(owner.data()["account"], "alice");

    const std::string granted = first.data()["session"].asString();
    EXPECT_FALSE(OvraPlatform::SessionStore().find(granted)->expires);
    EXPECT_EQ(call(kNode, 1, "test_privilege", {}, granted).code(), 0);
    EXPECT_EQ(call(kSession, 1, "delete", first.data(), granted).code(), 0);
    EXPECT_EQ(call(kNode, 1, "test_privilege", {}, granted).code(), 119);
}

TEST_F(Session, thatIsTemporaryEndsAfterAnHour) {
    addAccount("alice", true);
    const Reply reply = call(kSession, 1, "temp_create", {}, session("alice"));
    ASSERT_EQ(reply.code(), 0) << reply.text;
    const auto record = OvraPlatform::SessionStore().find(reply.data()["session"].asString());
    ASSERT_TRUE(record);
    EXPECT_EQ(record->expires.value_or(0) - record->created, 3600);
}

class Node : public Appliance {};

TEST_F(Node, tellsWhatItIsAskedFor) {
    addAccount("alice", false);
    const std::string sid = session("alice");
    const Reply bare = call(kNode, 1, "info", {}, sid);
    EXPECT_EQ(bare.data().getMemberNames(),
              (std::vector<std::string>{"hostname", "node_id", "serial"}));
    const Reply more =
        call(kNode, 1, "info", json(R"({"additional":["timezone","secrets"]})"), sid);
    EXPECT_EQ(more.data()["additional"].getMemberNames(), std::vector<std::string>{"timezone"});
    EXPECT_EQ(more.data()["node_id"], bare.data()["node_id"]);
}

TEST_F(Node, findsTheFirstEndpointThatItReaches) {
    addAccount("root", true);
    Json::Value params;
    params["conns"][0] = json(R"({"addr":"127.0.0.1","protocol":"http","port":1})");
    for (const bool tls : {true, false}) {
        Json::Value conn;
        conn["addr"] = "127.0.0.1";
        conn["protocol"] = tls ? "https" : "http";
        conn["port"] = port(tls);
        params["conns"].append(conn);
    }
    const Reply reply = call(kNode, 1, "test_connection", params, session("root"));
    EXPECT_EQ(reply.code(), 0);
    EXPECT_EQ(reply.data(), params["conns"][1]);
}

/// What a process of the appliance asks through the library.
Json::Value askLocally(const char *api, const char *method, const char *params = "{}") {
    Json::Value reply;
    OVRA::APIRunner().Exec(reply, api, 1, method, json(params), "admin");
    return reply;
}

TEST_F(Node, servesItsOwnProcessesAsAdministrators) {
    EXPECT_EQ(askLocally("OVRA.Core.Farlink", "get")["data"], json(R"({"enabled":false})"));
    EXPECT_EQ(askLocally(kNode, "test_privilege")["success"], true);
    EXPECT_EQ(askLocally(kCredential, "create")["error"]["code"], 106);
    EXPECT_EQ(askLocally("OVRA.Core.Auth", "login")["error"]["code"], 101);
    EXPECT_EQ(askLocally("OVRA.Core.Auth", "logout")["error"]["code"], 119);
}

} // namespace
