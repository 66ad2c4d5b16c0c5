// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "platform/store/raw_sqlite.h"
#include "support/doc_page.h"
#include "support/local_node.h"
#include "support/soon.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/api_registry.h>
#include <ovraplatform/peer_trust.h>
#include <ovraplatform/session_store.h>

#include <ctime>
#include <filesystem>
#include <functional>

namespace {

using OvraPlatform::Role;
using OvraTest::Appliance;
using OvraTest::json;
using OvraTest::Reply;

struct Scene {
    const char *api;
    const char *method;
    const char *params;
    int version;
    int nobody; ///< codes for a caller without a session, a user, and an administrator
    int user;
    int administrator;
    int here = administrator;    ///< for a process of the appliance
    int pairing = administrator; ///< for an account that may pair
};

constexpr char kNode[] = "OVRA.DR.Node";
constexpr char kSession[] = "OVRA.DR.Node.Session";
constexpr char kUser[] = "OVRA.Core.User";
constexpr char kCredential[] = "OVRA.DR.Node.Credential";
constexpr char kOneEndpoint[] = R"({"conns":[{"addr":"127.0.0.1","protocol":"http","port":1}]})";
constexpr char kFileUrl[] = R"({"url":"file:///etc/passwd","retries":0,"timeout":1})";
constexpr char kAliasUrl[] = R"({"url":"flk://nas3:443/x","retries":0,"timeout":1})";

const Scene kScenes[] = {
    {"OVRA.None", "get", "{}", 1, 102, 102, 102},
    {kNode, "none", "{}", 1, 103, 103, 103},
    {kNode, "info", "{}", 2, 104, 104, 104},
    {"OVRA.Core.Auth", "login", "{}", 2, 104, 104, 104},
    {"OVRA.Core.Auth", "login", "{}", 1, 106, 106, 106, 101},
    {"OVRA.Core.Auth", "logout", "{}", 1, 119, 0, 0, 119},
    {"OVRA.DR.Invite", "redeem", "{}", 1, 106, 106, 106, 101},
    {"OVRA.Core.Encryption", "getinfo", "{}", 1, 0, 0, 0},
    {kUser, "get", R"({"name":"user"})", 1, 119, 0, 0, 0, 105},
    {kUser, "get", R"({"name":"root"})", 1, 119, 105, 0, 0, 105},
    {kUser, "get", R"({"name":"none"})", 1, 119, 105, 106, 106, 105},
    {kUser, "get", "{}", 1, 119, 106, 106},
    {"OVRA.Core.Farlink", "get", "{}", 1, 119, 105, 105, 0},
    {kNode, "info", "{}", 1, 119, 0, 0},
    {kNode, "info", R"({"additional":"timezone"})", 1, 119, 106, 106},
    {kNode, "test_privilege", "{}", 1, 119, 105, 0},
    {kNode, "test_download_speed", "{}", 1, 119, 105, 106},
    {kNode, "test_download_speed", kFileUrl, 1, 119, 105, 106},
    {kNode, "test_download_speed", kAliasUrl, 1, 119, 105, 106},
    {kNode, "test_sync_speed", R"({"node_id":"n","retries":-1,"timeout":0})", 1, 119, 105, 106},
    {kNode, "test_connection", kOneEndpoint, 1, 119, 105, 500},
    {kNode, "test_connection", "{}", 1, 119, 105, 106},
    {"OVRA.DR.Status", "overview", "{}", 1, 119, 105, 0, 0, 105},
    {"OVRA.DR.Status", "overview", R"({"limit":5001})", 1, 119, 105, 106, 106, 105},
    {kSession, "create", R"({"node_id":"n1"})", 1, 104, 104, 104},
    {kSession, "create", R"({"node_id":"n1"})", 2, 119, 105, 0, 527},
    {kSession, "create", R"({"node_id":""})", 2, 119, 105, 106},
    {kSession, "temp_create", "{}", 1, 119, 105, 0, 527},
    {kSession, "get", R"({"session":"none"})", 1, 119, 528, 528},
    {kSession, "delete", R"({"session":"none"})", 1, 119, 105, 0},
    {kSession, "delete", "{}", 1, 119, 105, 106},
    {kCredential, "list", "{}", 1, 119, 105, 0},
    {kCredential, "create", "{}", 1, 119, 105, 106},
    {kCredential, "temp_create", "{}", 1, 119, 105, 106},
    {kCredential, "test_create", "{}", 1, 119, 105, 106},
    {kCredential, "set", "{}", 1, 119, 105, 106},
    {kCredential, "test_set", "{}", 1, 119, 105, 106},
    {kCredential, "get", R"({"cred_id":"none"})", 1, 119, 105, 404},
    {kCredential, "delete", "{}", 1, 119, 105, 106},
    {kCredential, "reverse_create", R"({"cred_id":"none"})", 1, 119, 105, 404, 106},
    {kCredential, "test_reverse_create", R"({"cred_id":"none"})", 1, 119, 105, 404, 106},
    {kCredential, "temp_reverse_create", R"({"cred_id":"none"})", 1, 119, 105, 404, 106},
    {kCredential, "relay", R"({"cred_id":"none","webapi":{}})", 1, 119, 105, 404}};

class Rights : public Appliance {};

TEST_F(Rights, AreAskedForOfEveryCaller) {
    addAccount("user", true); // not for long
    addAccount("root", true);
    addAccount("disabled", true);
    addAccount("gone", true);
    addAccount("pair", false);
    OvraPlatform::AccountStore accounts;
    const auto granted = [this](const char *user, const Scene &grant) {
        const Json::Value params = json(grant.params);
        return call(kSession, grant.version, grant.method, params, session(user))
            .data()["session"]
            .asString();
    };
    const Scene forNode{kSession, "create", R"({"node_id":"n1"})", 2, 0, 0, 0};
    const Scene lent{kSession, "temp_create", "{}", 1, 0, 0, 0};
    std::string ofUser = granted("user", forNode);
    const std::string ofDisabled = granted("disabled", forNode);
    const std::string ofGone = granted("gone", forNode);
    ASSERT_TRUE(accounts.setRole("user", Role::kUser) && accounts.setRole("pair", Role::kPairing) &&
                accounts.setDisabled("disabled", true) && accounts.remove("gone"));
    const struct {
        const char *name;
        std::function<std::string()> session; ///< a call may end it
        std::function<int(const Scene &)> code;
    } roles[] = {
        {"nobody", [] { return ""; }, &Scene::nobody},
        {"an unknown session", [] { return std::string(43, 'x'); }, &Scene::nobody},
        {"a node, whose account is gone", [&] { return ofGone; }, &Scene::nobody},
        {"a node, whose account is disabled", [&] { return ofDisabled; },
         [](const Scene &) { return 105; }},
        {"a user", [] { return session("user"); }, &Scene::user},
        {"an administrator", [] { return session("root"); }, &Scene::administrator},
        {"a node", [&] { return granted("root", forNode); }, &Scene::administrator},
        {"an account that may pair", [] { return session("pair"); }, &Scene::pairing},
        {"a node of that", [&] { return granted("pair", forNode); }, &Scene::pairing},
        {"a lent session", [&] { return granted("root", lent); }, &Scene::administrator},
        {"a node, whose account is no administrator any more",
         [&] {
             const bool ended = !OvraPlatform::SessionStore().find(ofUser);
             return ended ? ofUser = session("user") : ofUser;
         },
         &Scene::user},
    };
    for (const Scene &scene : kScenes) {
        const Json::Value params = json(scene.params);
        for (const auto &role : roles) {
            EXPECT_EQ(call(scene.api, scene.version, scene.method, params, role.session()).code(),
                      role.code(scene))
                << scene.api << " " << scene.method << " " << scene.params << " by " << role.name;
        }
        const Json::Value here = callHere(scene.api, scene.version, scene.method, params);
        EXPECT_EQ(here["success"] == true ? 0 : here["error"]["code"].asInt(), scene.here)
            << scene.api << " " << scene.method << " " << scene.params << " by a local process";
    }
}

TEST_F(Rights, OfAnAccountThatMayPairAreItsOwnAndNobodyElses) {
    addAccount("root", true);
    addAccount("pair", false);
    ASSERT_TRUE(OvraPlatform::AccountStore().setRole("pair", Role::kPairing));
    OvraTest::addCred("node_cred", "n1", "c1", "http", 1, "s");
    const std::string own = session("pair");
    const std::string others = session("root");
    const std::string other = R"({"session":")" + others + R"("})";
    constexpr char kBack[] = R"({"cred_id":"c1","local_account":"root"})";
    constexpr char kBothWays[] =
        R"({"auth":"session","session":"s","conn":{"addr":"127.0.0.1","protocol":"http","port":1},
            "cred_direction":"bidirection","local_account":"root"})";
    const auto relayed = [](const char *api, const char *method) {
        return std::string(R"({"cred_id":"c1","webapi":{"version":1,"api":")") + api +
               R"(","method":")" + method + R"("}})";
    };
    const std::tuple<const char *, const char *, std::string, int, int> cases[] = {
        // with the codes for it and for an administrator of a node that has no address
        {kSession, "delete", other, 105, 0},
        {kCredential, "reverse_create", kBack, 106, 401},
        {kCredential, "test_reverse_create", kBack, 106, 401},
        {kCredential, "temp_reverse_create", kBack, 106, 401},
        {kCredential, "create", kBothWays, 106, 401},
        {kCredential, "relay", relayed(kNode, "info"), 500, 500},
        {kCredential, "relay", relayed(kSession, "temp_create"), 105, 500},
        {kCredential, "relay", relayed(kCredential, "create"), 105, 500},
    };
    for (const auto &[api, method, params, code, ofRoot] : cases) {
        EXPECT_EQ(call(api, 1, method, json(params), own).code(), code) << method << params;
        EXPECT_EQ(call(api, 1, method, json(params), session("root")).code(), ofRoot)
            << method << params;
    }
}

/// Each method of the manual has rows above, and they say what the manual says.
TEST_F(Rights, AreThoseOfTheManual) {
    for (const auto &row : OvraTest::DocPage("docs/ovradrd.md").rows("What can be called")) {
        const std::string right = row.at(1).substr(0, row[1].find(';'));
        const bool higher = right == "administrator" || right == "local";
        const bool mayPair = right == "pairing";
        int scenes = 0;
        for (const Scene &scene : kScenes) {
            const std::string version = std::to_string(scene.version);
            if (row[0] ==
                "`" + std::string(scene.api) + "` " + version + " `" + scene.method + "`") {
                ++scenes;
                EXPECT_EQ(scene.nobody == 119, right != "anybody") << row[0];
                EXPECT_TRUE((scene.user == 105) == (higher || mayPair) || row[1] != right)
                    << row[0];
                EXPECT_TRUE((scene.pairing == 105) == higher || row[1] != right) << row[0];
                EXPECT_EQ(scene.administrator == 105, right == "local") << row[0];
            }
        }
        EXPECT_GT(scenes, 0) << "kScenes has no row for " << row[0] << ": add one";
    }
}

class Session : public Appliance {};

TEST_F(Session, IsWorthWhatItsAccountIsWorthNow) {
    addAccount("alice", true);
    addAccount("root", true);
    const std::string sid = session("alice");
    const std::string expired = session("root");
    OvraPlatform::AccountStore accounts;
    const auto code = [&] { return call(kNode, 1, "test_privilege", {}, sid).code(); };
    EXPECT_EQ(code(), 0);
    ASSERT_TRUE(accounts.setRole("alice", Role::kUser));
    EXPECT_EQ(code(), 105);
    ASSERT_TRUE(accounts.setRole("alice", Role::kAdministrator));
    ASSERT_TRUE(accounts.setDisabled("alice", true));
    EXPECT_EQ(code(), 105);
    ASSERT_TRUE(accounts.remove("alice"));
    EXPECT_EQ(code(), 119);

    EXPECT_EQ(call(kNode, 1, "info", {}, expired).code(), 0);
    const std::string now = std::to_string(std::time(nullptr));
    ASSERT_TRUE(OvraTest::RawSqlite(OvraPlatform::kSessionsFile)
                    .run("UPDATE session SET expires = " + now));
    EXPECT_EQ(call(kNode, 1, "info", {}, expired).code(), 119);
}

TEST_F(Session, IsLookedUpInTheFileThatIsThereNowAndNotTakenForExpiredWhenThatCannotBeRead) {
    addAccount("alice", true);
    // In each of the daemon's threads.
    const auto expectCode = [this](int code, const std::string &sid) {
        for (int i = 0; i < 20; ++i) {
            EXPECT_EQ(call(kNode, 1, "info", {}, sid).code(), code);
        }
    };
    const std::string before = session("alice");
    expectCode(0, before);
    std::filesystem::remove(OvraPlatform::kSessionsFile);
    const std::string after = session("alice");
    expectCode(119, before);
    expectCode(0, after);
    std::filesystem::resize_file(OvraPlatform::kSessionsFile, 10);
    expectCode(100, after);
}

TEST_F(Session, ForANodeIsReusedAndTiedToTheCallersAccountAndATemporaryOneEndsAfterAnHour) {
    addAccount("alice", true);
    const std::string sid = session("alice");
    const Json::Value node = json(R"({"node_id":"n1"})");
    const Reply first = call(kSession, 2, "create", node, sid);
    ASSERT_EQ(first.code(), 0) << first.text;
    EXPECT_EQ(call(kSession, 2, "create", node, sid).data(), first.data());
    EXPECT_NE(call(kSession, 2, "create", json(R"({"node_id":"n2"})"), sid).data(), first.data());
    EXPECT_EQ(call(kSession, 1, "get", first.data(), sid).data()["account"], "alice");

    const std::string granted = first.data()["session"].asString();
    EXPECT_FALSE(OvraPlatform::SessionStore().find(granted)->expires);
    EXPECT_EQ(call(kNode, 1, "test_privilege", {}, granted).code(), 0);
    EXPECT_EQ(call(kSession, 1, "delete", first.data(), granted).code(), 0);
    EXPECT_EQ(call(kNode, 1, "test_privilege", {}, granted).code(), 119);

    const Reply temporary = call(kSession, 1, "temp_create", {}, sid);
    const auto record = OvraPlatform::SessionStore().find(temporary.data()["session"].asString());
    ASSERT_TRUE(record) << temporary.text;
    EXPECT_EQ(record->expires.value_or(0) - record->created, 3600);
}

class Node : public Appliance {};

TEST_F(Node, TellsWhatItIsAskedFor) {
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

TEST_F(Node, FindsTheFirstEndpointThatItReaches) {
    addAccount("root", true);
    Json::Value params = json(kOneEndpoint);
    for (const bool tls : {true, false}) {
        Json::Value conn = json(R"({"addr":"127.0.0.1"})");
        conn["protocol"] = tls ? "https" : "http";
        conn["port"] = port(tls);
        params["conns"].append(conn);
    }
    EXPECT_EQ(call(kNode, 1, "test_connection", params, session("root")).data(),
              params["conns"][1]);
}

TEST_F(Node, IsWatchedBySomebodyWhoLooksInBothDirections) {
    // The appliance is its own peer, under another id: so it reaches, and is reached.
    addAccount("root", true);
    const std::string sid = session("root");
    Json::Value params = json(R"({"node_id":"n1","_hostname":"nas1"})");
    const std::string granted =
        call(kSession, 2, "create", params, sid).data()["session"].asString();
    OvraTest::addCred("node_cred", "n1", "c1", "https", port(true), granted);
    OvraTest::addCred("temp_cred", "n1", "t1", "https", port(true),
                      call(kSession, 1, "temp_create", {}, sid).data()["session"].asString());
    const auto key = OvraPlatform::peerFingerprint("https", "127.0.0.1", port(true), 10);
    ASSERT_TRUE(key && OvraPlatform::TrustStore().create());
    OvraPlatform::trustEndpoint("https", "127.0.0.1", port(true), key->fingerprint);
    const auto overview = [&] { return call("OVRA.DR.Status", 1, "overview", {}, sid).data(); };
    const auto peer = [&] { return overview()["peers"][0]; };
    EXPECT_EQ(peer()["name"], "nas1") << "as it called itself";
    ASSERT_TRUE(OvraTest::soon([&] {
        return overview()["temporary"][0].isMember("ends") &&
               peer()["reach"]["ways"][0].isMember("latency");
    }));
    const Json::Value found = peer();
    EXPECT_TRUE(found["reach"]["answers"].asBool());
    EXPECT_EQ(found["reach"]["ways"][0]["trusted"], key->fingerprint);
    EXPECT_GT(found["reach"]["ways"][0]["trusted_since"].asInt64(), 0);
    EXPECT_EQ(found["reached_by"][0]["account"], "root");
    EXPECT_EQ(found["reached_by"][0]["client"], "127.0.0.1");
    EXPECT_EQ(overview()["problems"][0]["kind"], "wrong_node") << "it is not n1";
    EXPECT_FALSE(found.isMember("version")) << "what another node says";
    const std::string all = call("OVRA.DR.Status", 1, "overview", {}, sid).text;
    EXPECT_EQ(all.find(granted), std::string::npos) << "no secret";
}

TEST_F(Node, TellsItsOwnProcessesHowItIsReached) {
    EXPECT_EQ(callHere("OVRA.Core.Farlink", 1, "get")["data"], json(R"({"enabled":false})"));
}

} // namespace
