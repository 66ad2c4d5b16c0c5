// SPDX-License-Identifier: Apache-2.0
#include "vendor/appliance.h"

using namespace OvraDRNode;
using namespace OvraTest;
using namespace OvraVendor;

namespace {

constexpr const char *kNoPermission = R"({"success":false,"error":{"code":105}})";

class Credential : public Appliance {
protected:
    void SetUp() override {
        Appliance::SetUp();
        DRNode::getLocalNodeId();
    }
    /// Creates a credential over the account and returns its id.
    std::string create() {
        DRNodeCredCreate flow;
        EXPECT_TRUE(flow.setCred(peer.conn, "joe", "pw", ""))
            << OvraDRCore::toString(flow.GetErr());
        EXPECT_TRUE(flow.process()) << OvraDRCore::toString(flow.GetErr());
        return flow.getNode().credId;
    }

    PeerNode peer{"192.0.2.7"};
};

} // namespace

TEST_F(Credential, IsMadeOverAnAccountThatIsLoggedOutAgain) {
    peer.remote.login = "joe/pw/123456";
    {
        DRNodeCredCreate flow;
        ASSERT_TRUE(flow.setCred(peer.conn, "joe", "pw", "123456"));
        ASSERT_TRUE(flow.process());
        EXPECT_EQ(peer.remote.sessions.count("login-1"), 1U) << "logged in while it lives";
    }
    EXPECT_EQ(rows(), "n1|192.0.2.7|granted-1\n");
    EXPECT_EQ(peer.remote.sessions, std::set<std::string>{"granted-1"});
    EXPECT_EQ(peer.remote.logouts, 1);
    EXPECT_EQ(peer.callOf("create").params["node_id"].asString(), DRNode::getLocalNodeId());
    EXPECT_EQ(peer.callOf("create").version, 2);
    EXPECT_EQ(peer.calls().find("login-1 info, login-1 create, granted-1 test_privilege"), 0U);
    EXPECT_EQ(NodeCache("n1", false).GetHostName(), "peer");
}

TEST_F(Credential, IsNotMadeWhenTheLogInIsRefusedOrTheRemoteLost) {
    for (const auto &[refusal, error] : {std::pair(400, 501), {402, 503}, {404, 505}}) {
        peer.remote.refusal = refusal;
        DRNodeCredCreate flow;
        EXPECT_FALSE(flow.setCred(peer.conn, "joe", "pw", "000000"));
        EXPECT_EQ(flow.GetErrCode(), error);
    }
    EXPECT_EQ(peer.remote.logins + peer.remote.logouts, 0);
    DRNodeCredCreate flow;
    ASSERT_TRUE(flow.setCred(peer.conn, "joe", "pw", ""));
    peer.remote.reachable = false;
    EXPECT_FALSE(flow.process());
    EXPECT_EQ(flow.GetErrCode(), 500);
    EXPECT_FALSE(flow.setCred(peer.conn, "joe", "pw", ""));
    EXPECT_EQ(flow.GetErrCode(), 500);
    EXPECT_EQ(rows(), "");
}

TEST_F(Credential, CarriesRequestsAndTheNextOneTakesOver) {
    PeerNode other("192.0.2.8");
    peer.grant("c1", "s1");
    other.grant("c2", "s2");
    NodeSender sender("n1");
    const auto send = [&] { return sender.process(WebAPI::getDRNodeInfoAPI({})).isSuccess(); };
    EXPECT_TRUE(send());
    EXPECT_EQ(peer.callOf("info").timeout, 60);
    EXPECT_FALSE(peer.callOf("info").sealed);
    peer.calls();

    peer.answers["info"] = kNoPermission;
    EXPECT_TRUE(send());
    EXPECT_EQ(peer.calls() + "; " + other.calls(), "s1 info; s2 info") << "the other endpoint";
    EXPECT_TRUE(send());
    EXPECT_EQ(peer.calls() + "; " + other.calls(), "; s2 info") << "is remembered";

    peer.answers.clear();
    other.remote.reachable = false;
    EXPECT_TRUE(send()) << "a request that did not get through goes over the first again";
    EXPECT_EQ(peer.calls() + "; " + other.calls(), "s1 info; ");

    const int probes = other.remote.probes;
    peer.remote.reachable = false;
    EXPECT_FALSE(send());
    EXPECT_EQ(sender.GetErrCode(), 500);
    EXPECT_EQ(other.remote.probes, probes) << "an endpoint held unreachable is left alone";
    EXPECT_FALSE(NodeSender("n1").isConnectable());
}

TEST_F(Credential, TurnsTheLibrarysErrorNumbersIntoItsOwn) {
    peer.grant("c1", "s1");
    for (const auto &[number, code] : {std::pair(4, 525), {6, 526}, {99, 524}, {10, 500}}) {
        peer.remote.error = number;
        CredSessionSender sender(peer.conn, "s1");
        EXPECT_FALSE(sender.process(WebAPI::getDRNodeInfoAPI({})).isValid()) << number;
        EXPECT_EQ(sender.GetErrCode(), code) << number;
    }
    EXPECT_FALSE(BaseSender::GetCachedConnectable(peer.conn)) << "timed out";
}

TEST_F(Credential, SealsWhatHasToBeSealed) {
    peer.grant("c1", "s1");
    const Conn here = Conn::https("192.0.2.1", 5001);
    const auto create = WebAPI::getDRNodeCredCreateAPI(here, "sid", "unidirection");
    EXPECT_TRUE(CredNodeSender("c1").process(create).isValid());
    EXPECT_TRUE(peer.callOf("create").sealed);
    OvraDRCore::Request upload = WebAPI::getDRNodeTestPrivilegeAPI();
    upload.setUpload("/usr/ovra/file", "file");
    EXPECT_TRUE(CredNodeSender("c1").process(upload).isValid());
    EXPECT_EQ(peer.callOf("test_privilege").uploadName, "file");
}

TEST_F(Credential, IsRenewedAndItsOldSessionReleased) {
    const std::string credId = create();
    PeerNode sameNode("192.0.2.8");
    sameNode.remote.sessions = {"granted-1"};
    peer.calls();
    sameNode.answers["create"] = R"({"success":true,"data":{"session":"renewed"}})";
    sameNode.remote.sessions.insert("renewed");
    {
        DRNodeCredSet flow(credId);
        ASSERT_TRUE(flow.setCred(sameNode.conn, "joe", "pw", ""));
        ASSERT_TRUE(flow.process());
    }
    EXPECT_EQ(rows(), "n1|192.0.2.8|renewed\n");
    EXPECT_EQ(sameNode.remote.sessions, std::set<std::string>{"renewed"});
    EXPECT_EQ(sameNode.remote.logouts, 1);

    PeerNode anotherNode("192.0.2.9", "n2");
    DRNodeCredSet flow(credId);
    ASSERT_TRUE(flow.setCred(anotherNode.conn, "joe", "pw", ""));
    EXPECT_FALSE(flow.process());
    EXPECT_EQ(flow.GetErrCode(), 518);
    EXPECT_EQ(rows(), "n1|192.0.2.8|renewed\n");
}

TEST_F(Credential, IsDeletedAndTheSessionGoesWithTheLastThatUsesIt) {
    const std::string first = create();
    DRNodeCredCreate copy;
    ASSERT_TRUE(copy.setCred(first));
    peer.answers["create"] = R"({"success":true,"data":{"session":"granted-1"}})";
    ASSERT_TRUE(copy.process());
    EXPECT_TRUE(DRNodeCredDelete(first).process());
    EXPECT_EQ(peer.remote.sessions.count("granted-1"), 1U);
    EXPECT_TRUE(DRNodeCredDelete(copy.getNode().credId).process());
    EXPECT_EQ(peer.remote.sessions.count("granted-1"), 0U);
    EXPECT_EQ(rows(), "");
}

TEST_F(Credential, IsMadeBackOverALocalSessionThatIsGoneAfterwards) {
    peer.grant("c1", "s1");
    const auto arm = [](CredReverseCreate &flow) {
        return flow.setCredId("c1") && flow.setLocalAccount("joe") &&
               flow.addLocalConns({Conn::https("192.0.2.1", 5001)});
    };
    CredReverseCreate flow;
    ASSERT_TRUE(arm(flow));
    EXPECT_TRUE(flow.process());
    EXPECT_EQ(flow.getCredInfo()["cred_id"].asString(), "r1");
    const Call call = peer.callOf("create");
    EXPECT_EQ(call.params["session"].asString(), "local-session-1");
    EXPECT_EQ(call.params["conn"]["addr"].asString(), "192.0.2.1");
    EXPECT_TRUE(call.sealed);
    EXPECT_TRUE(cgiLibrary().sessions.empty());

    peer.answers["create"] = R"({"success":false,"error":{"code":999}})";
    EXPECT_FALSE(flow.process());
    EXPECT_TRUE(cgiLibrary().sessions.empty()) << "after a refusal, too";

    TempCredReverseCreate temporary;
    ASSERT_TRUE(arm(temporary));
    EXPECT_TRUE(temporary.process());
    EXPECT_TRUE(temporary.check());
    EXPECT_EQ(temporary.getCredInfo()["src_cred"]["cred_id"].asString(), "r1");
    EXPECT_TRUE(cgiLibrary().sessions.empty());
}
