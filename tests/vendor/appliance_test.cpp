// SPDX-License-Identifier: Apache-2.0
#include "support/local_node.h"

#include <ovradrcore/json.h>
#include <ovradrnode/ovradrnode.h>
#include <ovravendor/stand_in.h>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>

using namespace OvraDRNode;
using namespace OvraTest;
using namespace OvraVendor;

namespace {

constexpr const char *kSuccess = R"({"success":true})";

Json::Value json(const std::string &text) {
    Json::Value value;
    EXPECT_TRUE(OvraDRCore::fromString(value, text)) << text;
    return value;
}

/// The node "n1" behind one endpoint, which handles the requests of other nodes. Its account is
/// "joe" with the password "pw".
struct PeerNode {
    explicit PeerNode(const std::string &host)
        : conn(Conn::https(host, 5001))
        , remote(credentialLibrary.remotes["https://" + host + ":5001"]) {
        remote.answer = [this](const Call &call) { return answer(call); };
    }

    Json::Value answer(const Call &call) {
        if (call.method == "delete") {
            remote.sessions.erase(call.params["session"].asString());
        }
        const auto found = answers.find(call.method);
        Json::Value document = json(found != answers.end() ? found->second : kSuccess);
        if (document["data"].isMember("session")) {
            remote.sessions.insert(document["data"]["session"].asString());
        }
        return document;
    }
    /// "session method" of each call since this was last called, joined by ", ".
    std::string calls() {
        std::string text;
        for (const Call &call : std::exchange(remote.calls, {})) {
            text += (text.empty() ? "" : ", ") + call.session + " " + call.method;
        }
        return text;
    }
    /// The first call of `method` so far; an empty one if there was none.
    Call callOf(const std::string &method) const {
        const auto found = std::find_if(remote.calls.begin(), remote.calls.end(),
                                        [&](const Call &call) { return call.method == method; });
        return found != remote.calls.end() ? *found : Call();
    }
    /// Stores a credential for this node with a session known to it.
    void grant(const std::string &credId, const std::string &session) {
        remote.sessions.insert(session);
        executeSql("INSERT INTO node_cred VALUES ('" + conn.addr + "', 'https', 5001, '" + credId +
                   "', 'n1', '" + session + "')");
    }

    Conn conn;
    Remote &remote;
    /// By method; any other call succeeds without data.
    std::map<std::string, std::string> answers = {
        {"info", R"({"success":true,"data":{"node_id":"n1","serial":"S1","hostname":"peer"}})"},
        {"test_connection",
         R"({"success":true,"data":{"addr":"192.0.2.1","protocol":"https","port":5001}})"},
        {"test_download_speed", R"({"success":true,"data":{"speed":"11 MB/s"}})"},
        {"get", R"({"success":true,"data":{"account":"joe"}})"},
        {"create", R"({"success":true,"data":{"session":"granted","src_cred":{"cred_id":"r1"}}})"},
    };
};

/// A provisioned node on the stand-ins, with the user joe. Each case must release every resource of
/// the vendor's libraries, exactly once.
class Appliance : public testing::Test {
protected:
    void SetUp() override {
        provisionNode();
        DRNode::getLocalNodeId();
        webApiLibrary.answer = [](const Call &call, const std::string &user) {
            const bool known = user == "admin" && call.params["name"] == "joe";
            return json(known ? kSuccess : R"({"success":false,"error":{"code":3106}})");
        };
    }
    void TearDown() override { EXPECT_EQ(leftOver(), ""); }

    static std::string rows() {
        return querySql("SELECT node_id, addr, session FROM node_cred ORDER BY rowid");
    }

    PeerNode peer{"192.0.2.7"};
    NodeSession session;
};

std::string text(const std::vector<Conn> &conns) {
    std::string all;
    for (const Conn &conn : conns) {
        all += conn.protocol + "://" + conn.addr + ":" + std::to_string(conn.port) + " ";
    }
    return all;
}

std::string sessionIds() {
    std::string all;
    for (const OvraVendor::Session &each : cgiLibrary.sessions) {
        all += each.id + " ";
    }
    return all;
}

void script(const std::string &name, const std::string &body) {
    const std::string folder = "/usr/ovra/ovradr/sbin/";
    std::filesystem::create_directories(folder);
    std::ofstream(folder + name) << "#!/bin/sh\n" << body << "\n";
    chmod((folder + name).c_str(), 0755);
}

} // namespace

TEST_F(Appliance, GivesTheNodeItsIdentity) {
    EXPECT_EQ(DRNode::getLocalNodeId().size(), 36U);
    EXPECT_EQ(DRNode::getLocalNodeId(), DRNode::getLocalNodeId());
    ASSERT_TRUE(DRNode::resetLocalNodeId());
    coreLibrary.readOnly = true;
    EXPECT_EQ(DRNode::getLocalNodeId(), "") << "a value that was not stored is none";
    EXPECT_EQ(DRNode::getLocalHostName() + " " + DRNode::getLocalSerial(), "appliance SERIAL1");
    sdkLibrary = {std::nullopt, std::nullopt};
    EXPECT_EQ(DRNode::getLocalHostName() + DRNode::getLocalSerial(), "");
}

TEST_F(Appliance, TellsTheNodeItsEndpoints) {
    EXPECT_EQ(text(DRNode::getLocalConn()), "");
    netLibrary.interfaces = {
        {"eth0", "192.0.2.1"}, {"eth1", "192.0.2.2", false}, {"eth2", "2001:db8::1"}};
    netLibrary.pppoe = "198.51.100.9";
    webApiLibrary.answer = [](const Call &call, const std::string &) {
        EXPECT_EQ(call.api + " " + call.method, "OVRA.Core.Farlink get");
        return json(R"({"success":true,"data":{"enabled":true,"server_alias":"home"}})");
    };
    EXPECT_EQ(text(DRNode::getLocalConn()),
              "https://192.0.2.1:5001 http://192.0.2.1:5000 https://2001:db8::1:5001 "
              "http://2001:db8::1:5000 https://198.51.100.9:5001 http://198.51.100.9:5000 "
              "flk://home:443 ");
    w3Library.https = -1;
    webApiLibrary.answer = nullptr;
    EXPECT_EQ(text(Conn::listLocal()),
              "http://192.0.2.1:5000 http://2001:db8::1:5000 http://198.51.100.9:5000 ")
        << "an endpoint without a port is none";
}

TEST_F(Appliance, AsksTheRelayWhereAnAliasIs) {
    auto &relay = credentialLibrary.relay;
    relay["home"] = json(R"({"host":"relay.example","protocol":"https","port":4001})");
    relay["odd"] = json(R"({"host":"relay.example","port":"4001"})");
    EXPECT_EQ(text({Conn::translateFarlink(Conn::farlink("home"))}), "https://relay.example:4001 ");
    EXPECT_FALSE(Conn::translateFarlink(Conn::farlink("odd")).isValid());
    EXPECT_FALSE(Conn::translateFarlink(Conn::farlink("nobody")).isValid());
}

TEST_F(Appliance, RunsWhatIsForThisNodeHere) {
    std::string asked;
    webApiLibrary.answer = [&asked](const Call &call, const std::string &user) {
        asked = user + ": " + call.api + " " + call.method + " " + std::to_string(call.version);
        return json(R"({"success":true,"data":{"hostname":"appliance"}})");
    };
    NodeSender sender(DRNode::getLocalNodeId());
    EXPECT_EQ(sender.process(WebAPI::getDRNodeInfoAPI({})).getDataFieldtoStr("hostname"),
              "appliance");
    EXPECT_EQ(asked, "admin: OVRA.DR.Node info 1");
    webApiLibrary.answer = nullptr;
    EXPECT_EQ(sender.process(WebAPI::getDRNodeInfoAPI({})).getErrCode(), 100) << "nobody to ask";
}

TEST_F(Appliance, RunsTheScriptsOfTheLinkTests) {
    peer.grant("c1", "s1");
    netLibrary.interfaces = {{"eth0", "192.0.2.1"}};
    script("TestDownloadSpeed.sh", R"(printf '%s %s %s' "$1" "$2" "$3")");
    script("TestSyncSpeed.sh",
           R"([ "$1" = setup ] && touch /tmp/speed-file && printf /tmp/speed-file)");
    Node node;
    EXPECT_EQ(node.TestDownloadSpeed("http://h/a b;`c`", 2, 3), "http://h/a b;`c` 2 3");
    EXPECT_EQ(node.TestSyncSpeed("n1", 2, 3), "11 MB/s");
    EXPECT_EQ(peer.callOf("test_download_speed").params["url"].asString(),
              "https://192.0.2.1:5001/webman/modules/ovradr//tmp/speed-file");
}

TEST_F(Appliance, MakesRenewsAndDeletesACredentialAndLogsOutEachTime) {
    using Ids = std::set<std::string>;
    peer.remote.login = "joe/pw/123456";
    std::string credId;
    {
        DRNodeCredCreate flow;
        ASSERT_TRUE(flow.setCred(peer.conn, "joe", "pw", "123456"));
        ASSERT_TRUE(flow.process()) << OvraDRCore::toString(flow.GetErr());
        EXPECT_EQ(peer.remote.sessions, (Ids{"granted", "login-1"}));
        credId = flow.getNode().credId;
    }
    EXPECT_EQ(rows(), "n1|192.0.2.7|granted\n");
    EXPECT_EQ(peer.remote.sessions, Ids{"granted"});
    EXPECT_EQ(peer.calls().find("login-1 info, login-1 create, granted test_privilege"), 0U);

    PeerNode sameNode("192.0.2.8");
    sameNode.remote.sessions = {"granted"};
    sameNode.answers["create"] = R"({"success":true,"data":{"session":"renewed"}})";
    {
        DRNodeCredSet flow(credId);
        ASSERT_TRUE(flow.setCred(sameNode.conn, "joe", "pw", ""));
        ASSERT_TRUE(flow.process()) << OvraDRCore::toString(flow.GetErr());
    }
    EXPECT_EQ(rows(), "n1|192.0.2.8|renewed\n");
    EXPECT_EQ(sameNode.remote.sessions, Ids{"renewed"});
    EXPECT_TRUE(DRNodeCredDelete(credId).process());
    EXPECT_EQ(rows(), "");
    EXPECT_TRUE(sameNode.remote.sessions.empty());
    EXPECT_EQ(peer.remote.logouts + sameNode.remote.logouts, 2);
}

TEST_F(Appliance, MakesNoCredentialWhenTheLogInIsRefusedOrTheRemoteLost) {
    DRNodeCredCreate flow;
    for (const auto &[refusal, error] : {std::pair(400, 501), {402, 503}, {404, 505}}) {
        peer.remote.refusal = refusal;
        EXPECT_FALSE(flow.setCred(peer.conn, "joe", "pw", "000000"));
        EXPECT_EQ(flow.GetErrCode(), error);
    }
    EXPECT_EQ(peer.remote.logins + peer.remote.logouts, 0);
    ASSERT_TRUE(flow.setCred(peer.conn, "joe", "pw", ""));
    peer.remote.reachable = false;
    EXPECT_FALSE(flow.process());
    EXPECT_EQ(flow.GetErrCode(), 500);
    EXPECT_EQ(rows(), "");
}

TEST_F(Appliance, CarriesRequestsOverTheCredentialsOfANode) {
    PeerNode other("192.0.2.8");
    peer.grant("c1", "s1");
    other.grant("c2", "s2");
    NodeSender sender("n1");
    const auto send = [&] { return sender.process(WebAPI::getDRNodeInfoAPI({})).isSuccess(); };
    EXPECT_TRUE(send());
    EXPECT_FALSE(peer.callOf("info").sealed);
    peer.calls();
    peer.answers["info"] = R"({"success":false,"error":{"code":105}})";
    EXPECT_TRUE(send());
    EXPECT_EQ(peer.calls() + "; " + other.calls(), "s1 info; s2 info") << "the other endpoint";
    other.remote.reachable = false;
    EXPECT_FALSE(send());
    EXPECT_EQ(peer.calls(), "s1 info");
    peer.remote.reachable = false;
    EXPECT_FALSE(send());
    EXPECT_EQ(sender.GetErrCode(), 500);
}

TEST_F(Appliance, LendsASessionForACredentialOnTheWayBack) {
    peer.grant("c1", "s1");
    const auto run = [](auto flow) {
        EXPECT_TRUE(flow.setCredId("c1") && flow.setLocalAccount("joe") &&
                    flow.addLocalConns({Conn::https("192.0.2.1", 5001)}));
        const bool done = flow.process();
        EXPECT_EQ(sessionIds(), "") << "gone afterwards";
        return done ? OvraDRCore::toString(flow.getCredInfo()) : "";
    };
    EXPECT_NE(run(CredReverseCreate()).find(R"("cred_id":"r1")"), std::string::npos);
    const Call call = peer.callOf("create");
    EXPECT_EQ(call.params["session"].asString(), "local-session-1");
    EXPECT_TRUE(call.sealed);
    peer.answers["create"] = R"({"success":false,"error":{"code":999}})";
    EXPECT_EQ(run(CredReverseCreate()), "");
}

TEST_F(Appliance, MakesASessionForANodeAndAUser) {
    unsetenv("REMOTE_ADDR");
    const std::string id = session.CreateNodeSession("n1", "joe");
    ASSERT_EQ(sessionIds(), id + " ");
    const OvraVendor::Session made = cgiLibrary.sessions[0];
    EXPECT_EQ(made.user + " " + made.app + " " + made.extra, R"(joe Tidewater {"node_id":"n1"})");
    EXPECT_EQ(made.ui, R"({"hide":true,"title":"session"})") << "the rest of the template stays";
    EXPECT_EQ(made.timeout, -1);
    EXPECT_EQ(made.client + " " + std::getenv("REMOTE_PORT"), "127.0.0.1 5000");
    EXPECT_EQ(session.CreateNodeSession("n1", "joe"), id);
    EXPECT_EQ(session.GetUserBySession(id), "joe");
    EXPECT_EQ(session.CreateNodeSession("n1", "nobody"), "");
    EXPECT_EQ(session.GetErrCode(), 527);
    for (const int option : {1, 3, 7, 10}) {
        cgiLibrary.refusedOptions = {option};
        EXPECT_EQ(session.CreateNodeSession("n2", "joe"), "") << option;
        EXPECT_EQ(session.GetErrCode(), 511) << option;
    }
    cgiLibrary.refusedOptions = {9, 11};
    EXPECT_NE(session.CreateNodeSession("n2", "joe"), "") << "can be without these";
    webApiLibrary.answer = [](const Call &, const std::string &) { return json(kSuccess); };
    EXPECT_NE(session.CreateTempSession(std::string(600, 'j'), 60), "");
    EXPECT_EQ(cgiLibrary.sessions.back().user, std::string(491, 'j'));
}

TEST_F(Appliance, RemovesASessionByItsIdItsUserOrWithAllOfThem) {
    cgiLibrary.sessions.push_back({"desktop-1", "joe", "desktop", "", "", "", -1});
    webApiLibrary.answer = [](const Call &, const std::string &) { return json(kSuccess); };
    const std::string first = session.CreateNodeSession("n1", "joe");
    EXPECT_NE(session.CreateTempSession("joe", 300), "");
    const std::string ann = session.CreateNodeSession("n1", "ann");
    session.DeleteBySessionId(first);
    EXPECT_EQ(session.GetUserBySession(first), "");
    session.DeleteByUser("joe");
    EXPECT_EQ(sessionIds(), "desktop-1 " + ann + " ");
    session.DeleteAllNodeSession();
    EXPECT_EQ(sessionIds(), "desktop-1 ");
}
