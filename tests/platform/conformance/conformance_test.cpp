// SPDX-License-Identifier: Apache-2.0

// The node library's requirements on any implementation of the platform interfaces. These tests may
// run on an appliance: they write to a temporary folder only, and their login sessions belong to a
// separate application and are removed.

#include <ovracgi/ovracgi.h>
#include <ovracore/ovracore.h>
#include <ovracredential/cred_request.h>
#include <ovranet/ovranet.h>
#include <ovraw3/talo.h>
#include <ovrawebapi/api_runner.h>

#include <gtest/gtest.h>
#include <json-c/json_object.h>
#include <json/writer.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>

namespace {

constexpr const char *kApplication = "OvraDRNode conformance";

/// Nothing listens there.
constexpr int kClosedPort = 1;
/// Cannot connect, or timed out: an endpoint that does not answer gives one of the two.
const std::set<int> kNoAnswer{5, 10};

using Buffer = std::array<char, 1024>;

struct Store : OvraCgi {
    Store()
        : OvraCgi{} {
        EXPECT_EQ(OvraCgiInit("", this), 0);
    }
    ~Store() { OvraCgiFree(this); }
    Store(const Store &) = delete;
    Store &operator=(const Store &) = delete;
};

/// A session created as by the node library, in the same order.
std::string login(const char *extra) {
    const int on = 1;
    const int timeout = -1;
    Store store;
    std::snprintf(store.user, sizeof(store.user), "%s", "admin");
    EXPECT_NE(OvraCgiSetOption(&store, 1, &on), 0);
    EXPECT_NE(OvraCgiSetOption(&store, 3, &on), 0);
    EXPECT_NE(OvraCgiSetOption(&store, 7, kApplication), 0);
    EXPECT_NE(OvraCgiSetOption(&store, 10, &timeout), 0);
    EXPECT_NE(OvraCgiSetOption(&store, 11, OvraCgiLoginUIJsonConfigTemplate()), 0);
    EXPECT_NE(OvraCgiSetOption(&store, 9, extra), 0);
    std::array<char, 101> sid{};
    EXPECT_EQ(OvraCgiLoginNoAuth(&store, sid.data(), 100, nullptr), 1);
    return sid.data();
}

std::string field(json_object *record, int number) {
    Buffer buffer{};
    return OvraCgiJsonRecordGet(record, number, buffer.data(), buffer.size()) != 0 ? buffer.data()
                                                                                   : "";
}

std::string fieldOf(const std::string &sid, int number) {
    Store store;
    json_object *record = nullptr;
    if (OvraCgiGetSessionBySID(&store, sid.c_str(), &record) != 1) {
        return "gone";
    }
    std::string value = field(record, number);
    json_object_put(record);
    return value;
}

/// Collects the session ids of our application into the given set, and keeps all.
int collect(json_object *record, void *argument) {
    if (field(record, 13) == kApplication) {
        static_cast<std::set<std::string> *>(argument)->insert(field(record, 2));
    }
    return 1;
}

/// Removes the sessions of our application that name this node.
int removeNode(json_object *record, void *argument) {
    const bool ours = field(record, 13) == kApplication;
    return ours && field(record, 14) == static_cast<const char *>(argument) ? 0 : 1;
}

} // namespace

TEST(Conformance, KeyValueFilesKeepWhatIsWritten) {
    std::string folder = "/tmp/conformance.XXXXXX";
    ASSERT_NE(mkdtemp(folder.data()), nullptr);
    const std::string path = folder + "/node.info";
    Buffer value{};
    EXPECT_EQ(OLIBCFileExist(path.c_str()), 0);
    EXPECT_LT(OLIBCFileGetKeyValue(path.c_str(), "node_id", value.data(), 128, 0), 0);
    EXPECT_GE(OLIBCFileSetKeyValue(path.c_str(), "node_id", "first", "%s=\"%s\"\n"), 0);
    std::ofstream(path, std::ios::app) << "other=\"kept\"\n";
    EXPECT_GE(OLIBCFileSetKeyValue(path.c_str(), "node_id", "second", "%s=\"%s\"\n"), 0);
    EXPECT_NE(OLIBCFileExist(path.c_str()), 0);
    EXPECT_GE(OLIBCFileGetKeyValue(path.c_str(), "node_id", value.data(), 128, 0), 0);
    EXPECT_STREQ(value.data(), "second");
    EXPECT_GE(OLIBCFileGetKeyValue(path.c_str(), "other", value.data(), 128, 0), 0);
    EXPECT_STREQ(value.data(), "kept");
    EXPECT_LT(OLIBCFileGetKeyValue(path.c_str(), "none", value.data(), 128, 0), 0);
    std::filesystem::remove_all(folder);
}

TEST(Conformance, ProgramsRunWithoutAShell) {
    FILE *stream = OLIBCPopen("/bin/echo", "r", "a  b;`c`", "$HOME", nullptr);
    ASSERT_NE(stream, nullptr);
    Buffer line{};
    EXPECT_NE(std::fgets(line.data(), static_cast<int>(line.size()), stream), nullptr);
    EXPECT_STREQ(line.data(), "a  b;`c` $HOME\n");
    EXPECT_EQ(OLIBCPclose(stream), 0);
    EXPECT_EQ(OLIBCPopen("/nowhere/program", "r", nullptr), nullptr);
}

TEST(Conformance, TheApplianceSaysWhoAndWhereItIs) {
    Buffer text{};
    EXPECT_GE(OVRALnxGetHostname(text.data(), static_cast<int>(text.size())), 0);
    EXPECT_STRNE(text.data(), "");
    text.fill('\0');
    EXPECT_GE(OLIBGetSerialNumber(text.data(), static_cast<int>(text.size())), 0);
    EXPECT_STRNE(text.data(), "");
    for (const int port : {ovraw3::Talo().GetHttpPort(), ovraw3::Talo().GetHttpsPort()}) {
        EXPECT_TRUE(port == -1 || OVRA::APIValidator::IsPort(port)) << port;
    }
    EXPECT_TRUE(OVRA::APIValidator::IsPort(1) && OVRA::APIValidator::IsPort(65535));
    for (const int port : {-1, 0, 65536}) {
        EXPECT_FALSE(OVRA::APIValidator::IsPort(port)) << port;
    }

    std::array<OLIBNetInterface, 33> table{};
    const int count = OLIBNetGetInterfaceInfo(table.data(), 32, 18);
    EXPECT_LE(count, 32);
    for (int i = 0; i < count; ++i) {
        const OLIBNetInterface &entry = table.at(static_cast<std::size_t>(i));
        EXPECT_LT(std::strlen(entry.address), sizeof(entry.address));
        EXPECT_STRNE(entry.address, "127.0.0.1");
    }
    if (OVRAPPPoECheckStatus(1) == 1) {
        EXPECT_EQ(OVRAPPPoeNetInfoGet(text.data(), static_cast<int>(text.size()), 0, 0), 0);
    }
}

TEST(Conformance, ALocalCallIsAnsweredWithADocument) {
    Json::Value out;
    OVRA::APIRunner().Exec(out, "OVRA.Core.Farlink", 1, "get", Json::Value(), "admin");
    EXPECT_TRUE(out.isObject() && out["success"].isBool()) << out;
}

TEST(Conformance, AnEndpointThatDoesNotAnswerIsAnError) {
    OVRACred *cred = OVRACredAlloc();
    OVRACredSess *sess = OVRACredSessAlloc();
    ASSERT_TRUE(cred != nullptr && sess != nullptr);
    EXPECT_EQ(OVRACredItemSetProtocol(cred, "https"), 0);
    EXPECT_EQ(OVRACredItemSetHost(cred, "127.0.0.1"), 0);
    EXPECT_EQ(OVRACredItemSetPort(cred, kClosedPort), 0);
    EXPECT_EQ(OVRACredItemSetRemoteAccount(cred, "joe"), 0);
    EXPECT_EQ(OVRACredItemSetRemotePasswd(cred, "pw"), 0);
    EXPECT_EQ(OVRACredSessItemSetAccessToken(sess, "token"), 0);

    OVRA::CredRequest probe;
    EXPECT_NE(probe.SetURL("https", "127.0.0.1", kClosedPort, "webapi/query.cgi"), 0);
    EXPECT_NE(probe.SetDefaultTimeout(10), 0);
    EXPECT_EQ(probe.Process(true, 2), 0);
    EXPECT_EQ(kNoAnswer.count(probe.GetError()), 1U) << probe.GetError();

    OVRA::CredRequest call;
    EXPECT_NE(OVRA::CredRequest::CreateWebAPIRequest(call, cred, sess, "OVRA.DR.Node", 1, "info",
                                                     Json::Value()),
              0);
    EXPECT_NE(call.SetResponseTimeout(60), 0);
    EXPECT_NE(call.SetEncryptMode(2), 0);
    EXPECT_EQ(call.Process(true, 0), 0);
    EXPECT_EQ(kNoAnswer.count(call.GetError()), 1U) << call.GetError();
    EXPECT_EQ(call.GetResponse(), "");

    Json::Value out;
    EXPECT_EQ(OVRA::CredRequestUtil::LoginWithOTP(cred, "", sess, &out), 0);
    EXPECT_FALSE(out.isObject() && out.get("success", false).asBool()) << out;
    Json::Value info;
    OVRA::CredRequestFarlink::GetConnInfo("no-such-alias", info, nullptr);
    EXPECT_FALSE(info.isObject() && info.isMember("host")) << info;
    OVRACredSessFree(sess);
    OVRACredFree(cred);
}

TEST(Conformance, TheSessionStoreIsSearchedAndClearedByAWalk) {
    const std::string one = login(R"({"node_id":"n1"})");
    const std::string two = login(R"({"node_id":"n2"})");
    const std::string three = login(R"({"node_id":"n1"})");
    EXPECT_EQ(fieldOf(one, 1) + fieldOf(one, 2) + fieldOf(one, 14),
              "admin" + one + R"({"node_id":"n1"})");
    Store store;
    std::set<std::string> found;
    EXPECT_EQ(OvraCgiRemoveSessionByFunc(&store, collect, &found), 0);
    EXPECT_EQ(found, (std::set<std::string>{one, two, three}))
        << "each of them, none in place of another";
    std::string node = R"({"node_id":"n1"})";
    EXPECT_EQ(OvraCgiRemoveSessionByFunc(&store, removeNode, node.data()), 0);
    EXPECT_EQ(fieldOf(one, 2) + fieldOf(three, 2) + fieldOf(two, 2), "gonegone" + two);
    EXPECT_EQ(OvraCgiRemoveSessionByIndex(&store, 2, two.c_str()), 0);
    EXPECT_EQ(OvraCgiRemoveSessionByIndex(&store, 2, two.c_str()), 0) << "also when there is none";
    EXPECT_EQ(fieldOf(two, 2), "gone");
}

TEST(Conformance, TheClientIsTheOneOfTheEnvironment) {
    unsetenv("REMOTE_ADDR");
    Buffer address{};
    EXPECT_EQ(OvraCgiGetRemoteIP(address.data(), address.size()), -1);
    setenv("REMOTE_ADDR", "192.0.2.50", 1);
    EXPECT_GE(OvraCgiGetRemoteIP(address.data(), address.size()), 0);
    EXPECT_STREQ(address.data(), "192.0.2.50");
}
