// SPDX-License-Identifier: Apache-2.0
#include "vendor/appliance.h"

#include <sys/stat.h>

#include <filesystem>
#include <fstream>

using namespace OvraDRNode;
using namespace OvraTest;
using namespace OvraVendor;

namespace {

std::string text(const std::vector<Conn> &conns) {
    std::string all;
    for (const Conn &conn : conns) {
        all += conn.protocol + "://" + conn.addr + ":" + std::to_string(conn.port) + " ";
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
    const std::string id = DRNode::getLocalNodeId();
    EXPECT_EQ(id.size(), 36U);
    EXPECT_EQ(DRNode::getLocalNodeId(), id);
    EXPECT_TRUE(DRNode::isLocalNodeId(id) && DRNode::getLocalNode().isValid());
    std::ifstream file(kIdentityFile);
    std::string line;
    std::getline(file, line);
    EXPECT_EQ(line, "node_id=\"" + id + "\"");
    EXPECT_TRUE(DRNode::resetLocalNodeId());
    EXPECT_NE(DRNode::getLocalNodeId(), id);

    ASSERT_TRUE(DRNode::resetLocalNodeId());
    coreLibrary().readOnly = true;
    EXPECT_EQ(DRNode::getLocalNodeId(), "") << "a value that was not stored is none";

    EXPECT_EQ(DRNode::getLocalHostName() + " " + DRNode::getLocalSerial(), "appliance SERIAL1");
    sdkLibrary().serial.reset();
    sdkLibrary().hostName.reset();
    EXPECT_EQ(DRNode::getLocalHostName() + DRNode::getLocalSerial(), "");
}

TEST_F(Appliance, TellsTheNodeItsEndpoints) {
    EXPECT_EQ(text(DRNode::getLocalConn()), "");
    netLibrary().interfaces = {
        {"eth0", "192.0.2.1"}, {"eth1", "192.0.2.2", false}, {"eth2", "2001:db8::1"}};
    netLibrary().pppoe = "198.51.100.9";
    webApiLibrary().answer = [](const Call &call, const std::string &) {
        EXPECT_EQ(call.api + " " + call.method, "OVRA.Core.Farlink get");
        return json(R"({"success":true,"data":{"enabled":true,"server_alias":"home"}})");
    };
    EXPECT_EQ(text(DRNode::getLocalConn()),
              "https://192.0.2.1:5001 http://192.0.2.1:5000 https://2001:db8::1:5001 "
              "http://2001:db8::1:5000 https://198.51.100.9:5001 http://198.51.100.9:5000 "
              "flk://home:443 ");
    w3Library().https = -1;
    webApiLibrary().answer = nullptr;
    EXPECT_EQ(text(Conn::listLocal()),
              "http://192.0.2.1:5000 http://2001:db8::1:5000 http://198.51.100.9:5000 ")
        << "an endpoint without a port is none";
}

TEST_F(Appliance, AsksTheRelayWhereAnAliasIs) {
    credentialLibrary().relay["home"] =
        json(R"({"host":"relay.example","protocol":"https","port":4001})");
    credentialLibrary().relay["odd"] = json(R"({"host":"relay.example","port":"4001"})");
    EXPECT_EQ(text({Conn::translateFarlink(Conn::farlink("home"))}), "https://relay.example:4001 ");
    EXPECT_FALSE(Conn::translateFarlink(Conn::farlink("odd")).isValid());
    EXPECT_FALSE(Conn::translateFarlink(Conn::farlink("nobody")).isValid());
}

TEST_F(Appliance, RunsWhatIsForThisNodeHere) {
    std::string asked;
    webApiLibrary().answer = [&asked](const Call &call, const std::string &user) {
        asked = user + ": " + call.api + " " + call.method + " " + std::to_string(call.version);
        return json(R"({"success":true,"data":{"hostname":"appliance"}})");
    };
    NodeSender sender(DRNode::getLocalNodeId());
    EXPECT_EQ(sender.process(WebAPI::getDRNodeInfoAPI({})).getDataFieldtoStr("hostname"),
              "appliance");
    EXPECT_EQ(asked, "admin: OVRA.DR.Node info 1");
    EXPECT_TRUE(
        CredNodeSender(DRNode::getLocalNode()).process(WebAPI::getDRNodeInfoAPI({})).isSuccess());

    webApiLibrary().answer = nullptr;
    EXPECT_EQ(sender.process(WebAPI::getDRNodeInfoAPI({})).getErrCode(), 100) << "nobody to ask";
}

TEST_F(Appliance, RunsTheScriptsOfTheLinkTests) {
    PeerNode peer("192.0.2.7");
    peer.grant("c1", "s1");
    netLibrary().interfaces = {{"eth0", "192.0.2.1"}};
    script("TestDownloadSpeed.sh", R"(printf '%s %s %s' "$1" "$2" "$3")");
    script("TestSyncSpeed.sh",
           R"([ "$1" = setup ] && touch /tmp/speed-file && printf /tmp/speed-file)");
    Node node;
    EXPECT_EQ(node.TestDownloadSpeed("http://h/a b;`c`", 2, 3), "http://h/a b;`c` 2 3");
    EXPECT_EQ(node.TestSyncSpeed("n1", 2, 3), "11 MB/s");
    EXPECT_EQ(peer.callOf("test_download_speed").params["url"].asString(),
              "https://192.0.2.1:5001/webman/modules/ovradr//tmp/speed-file");
    EXPECT_FALSE(std::filesystem::exists("/tmp/speed-file"));
    EXPECT_EQ(coreLibrary().streams.ever, 2);
    std::filesystem::remove("/usr/ovra/ovradr/sbin/TestDownloadSpeed.sh");
    EXPECT_EQ(node.TestDownloadSpeed("u", 0, 0), "");
    EXPECT_EQ(node.GetErrCode(), 401);
}
