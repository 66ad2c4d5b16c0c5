// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovradrcore/json.h>
#include <ovradrnode/node_api.h>

#include <gtest/gtest.h>

using namespace OvraDRNode;
using namespace OvraDRNode::WebAPI;

namespace {

const Conn kConn = Conn::https("h", 5001);
const std::string kConnText = R"({"addr":"h","port":5001,"protocol":"https"})";
const std::string kNoConn = R"([{"addr":"","port":-1,"protocol":""}])";

} // namespace

TEST(NodeApi, EveryRequestOfTheCatalogue) {
    const struct {
        Request request;
        const char *api;
        const char *method;
        int version;
        std::string params;
        bool sealed;
    } cases[] = {
        {OvraCoreUserGetAPI("joe"), "OVRA.Core.User", "get", 1, R"({"name":"joe"})", false},
        {getDRNodeSessionCreateAPI("n"), "OVRA.DR.Node.Session", "create", 2, R"({"node_id":"n"})",
         false},
        {getDRNodeSessionTempCreateAPI(), "OVRA.DR.Node.Session", "temp_create", 1, "{}", false},
        {getDRNodeSessionDeleteAPI("s"), "OVRA.DR.Node.Session", "delete", 1, R"({"session":"s"})",
         false},
        {getDRNodeSessionGetAPI("s"), "OVRA.DR.Node.Session", "get", 1, R"({"session":"s"})",
         false},
        {getDRNodeInfoAPI({}), "OVRA.DR.Node", "info", 1, "{}", false},
        {getDRNodeInfoAPI({"b", "a"}), "OVRA.DR.Node", "info", 1, R"({"additional":["b","a"]})",
         false},
        {getDRNodeCredCreateAPI(kConn, "s", "d"), "OVRA.DR.Node.Credential", "create", 1,
         R"({"auth":"session","conn":)" + kConnText + R"(,"cred_direction":"d","session":"s"})",
         true},
        {getDRNodeCredCreateAPI(kConn, "a", "p", "1", "d"), "OVRA.DR.Node.Credential", "create", 1,
         R"({"account":"a","auth":"account","conn":)" + kConnText +
             R"(,"cred_direction":"d","otpcode":"1","password":"p"})",
         true},
        {getDRNodeCredCreateAPI("c"), "OVRA.DR.Node.Credential", "create", 1,
         R"({"auth":"cred_id","cred_direction":"unidirection","cred_id":"c"})", false},
        {getDRNodeCredGetAPI("c"), "OVRA.DR.Node.Credential", "get", 1, R"({"cred_id":"c"})",
         false},
        {getDRNodeCredSetAPI("c", kConn, "a", "p", ""), "OVRA.DR.Node.Credential", "set", 1,
         R"({"account":"a","addr":"h","cred_id":"c","password":"p","port":5001,"protocol":"https"})",
         true},
        {getDRNodeTestSyncSpeedAPI("n", 0, 0), "OVRA.DR.Node", "test_sync_speed", 1,
         R"({"node_id":"n","retries":0,"timeout":0})", false},
        {getDRNodeTestDownloadSpeedAPI("u", 2, 3), "OVRA.DR.Node", "test_download_speed", 1,
         R"({"retries":2,"timeout":3,"url":"u"})", false},
        {getDRNodeTestPrivilegeAPI(), "OVRA.DR.Node", "test_privilege", 1, "{}", false},
        {getDRNodeCredRelayAPI("c", getDRNodeTestPrivilegeAPI()), "OVRA.DR.Node.Credential",
         "relay", 1,
         R"({"cred_id":"c","webapi":{"api":"OVRA.DR.Node","method":"test_privilege","params":{},)"
         R"("version":1}})",
         false},
        {getDRNodeTestConnectionAPI({Conn(), kConn}), "OVRA.DR.Node", "test_connection", 1,
         R"({"conns":[)" + kConnText + "]}", false},
        {getDRNodeCredReverseCreateAPI("c", Conn()), "OVRA.DR.Node.Credential", "reverse_create", 1,
         R"({"cred_id":"c"})", false},
        {getDRNodeTestCredReverseCreateAPI("c", kConn), "OVRA.DR.Node.Credential",
         "test_reverse_create", 1, R"({"conn":)" + kConnText + R"(,"cred_id":"c"})", false},
        {getDRNodeTempCredReverseCreateAPI("c", kConn), "OVRA.DR.Node.Credential",
         "temp_reverse_create", 1, R"({"conn":)" + kConnText + R"(,"cred_id":"c"})", false},
        {getDRNodeTestCredCreateAPI(kConn, "a", "s"), "OVRA.DR.Node.Credential", "test_create", 1,
         R"({"account":"a","auth":"session","conn":)" + kConnText + R"(,"session":"s"})", true},
        {getDRNodeTestCredCreateAPI(kConn, "a", "p", "1"), "OVRA.DR.Node.Credential", "test_create",
         1,
         R"({"account":"a","auth":"account","conn":)" + kConnText +
             R"(,"otpcode":"1","password":"p"})",
         true},
        {getDRNodeTestCredSetAPI("c", kConn, "a", "p", "1"), "OVRA.DR.Node.Credential", "test_set",
         1,
         R"({"account":"a","addr":"h","cred_id":"c","otpcode":"1","password":"p","port":5001,)"
         R"("protocol":"https"})",
         true},
        {getDRNodeTempCredCreateAPI(kConn, "a", "p", ""), "OVRA.DR.Node.Credential", "temp_create",
         1, R"({"account":"a","auth":"account","conn":)" + kConnText + R"(,"password":"p"})", true},
        {getDRNodeTempCredCreateAPI(kConn, "s"), "OVRA.DR.Node.Credential", "temp_create", 1,
         R"({"auth":"session","conn":)" + kConnText + R"(,"session":"s"})", true},
    };
    for (const auto &each : cases) {
        EXPECT_TRUE(each.request.isValid()) << each.method;
        EXPECT_EQ(each.request.getAPI(), each.api);
        EXPECT_EQ(each.request.getMethod(), each.method);
        EXPECT_EQ(each.request.getVersion(), each.version) << each.method;
        EXPECT_EQ(OvraDRCore::toString(each.request.getParams()), each.params) << each.method;
        EXPECT_EQ(each.request.isEncryptRequired(), each.sealed) << each.method;
    }
}

TEST(NodeApi, ARefusedArgumentIsAnInvalidRequestAndOneLine) {
    const std::string no = kNoConn.substr(1, kNoConn.size() - 2);
    const struct {
        std::function<Request()> build;
        const char *function;
        std::string message; ///< empty: refused silently
    } cases[] = {
        {[] { return OvraCoreUserGetAPI(""); }, "", ""},
        {[] { return getDRNodeSessionGetAPI(""); }, "", ""},
        {[] { return getDRNodeSessionCreateAPI(""); }, "getDRNodeSessionCreateAPI", "Bad nodeId[]"},
        {[] { return getDRNodeSessionDeleteAPI(""); }, "getDRNodeSessionDeleteAPI",
         "Bad sessionId"},
        {[] { return getDRNodeCredCreateAPI(Conn(), "s", "d"); }, "getDRNodeCredCreateAPI",
         "invalid conn[" + no + "]/empty session or bad credType[d]"},
        {[] { return getDRNodeCredCreateAPI(kConn, "a", "", "1", "d"); }, "getDRNodeCredCreateAPI",
         "Invalid conn[" + kConnText + "] or empty account[a]/password or bad credType[d]"},
        {[] { return getDRNodeCredCreateAPI(""); }, "getDRNodeCredCreateAPI", "Invalid credId[]"},
        {[] { return getDRNodeCredGetAPI(""); }, "getDRNodeCredGetAPI", "credId[]"},
        {[] { return getDRNodeCredSetAPI("", kConn, "a", "p", ""); }, "getDRNodeCredSetAPI",
         "empty conn[" + kConnText + "] or empty account[a]/password/credId[]"},
        {[] { return getDRNodeTestSyncSpeedAPI("n", -1, 0); }, "getDRNodeTestSyncSpeedAPI",
         "invalid nodeId[n], retries[-1], or timeout[0]"},
        {[] { return getDRNodeTestDownloadSpeedAPI("u", 0, -1); }, "getDRNodeTestDownloadSpeedAPI",
         "invalid url[u], retries[0], or timeout[-1]"},
        {[] { return getDRNodeCredRelayAPI("", getDRNodeCredSetAPI("c", kConn, "a", "pw", "")); },
         "getDRNodeCredRelayAPI",
         "Invalid credId [] or relayAPI [{\"api\":\"OVRA.DR.Node.Credential\",\"encrypt\":true,"
         "\"method\":\"set\",\"params\":{\"account\":\"a\",\"addr\":\"h\",\"cred_id\":\"c\","
         "\"password\":\"***\",\"port\":5001,\"protocol\":\"https\"},\"version\":1}]"},
        {[] { return getDRNodeTestConnectionAPI({Conn()}); }, "getDRNodeTestConnectionAPI",
         "Empty connections"},
        {[] { return getDRNodeCredReverseCreateAPI("", kConn); }, "getDRNodeCredReverseCreateAPI",
         "Bad credId[]"},
        {[] { return getDRNodeTestCredReverseCreateAPI("", kConn); },
         "getDRNodeTestCredReverseCreateAPI", "Bad credId []"},
        {[] { return getDRNodeTestCredCreateAPI(kConn, "", "s"); }, "getDRNodeTestCredCreateAPI",
         "invalid conn[" + kConnText + "] or empty account [] /empty session"},
        {[] { return getDRNodeTestCredSetAPI("c", kConn, "a", "", ""); }, "getDRNodeTestCredSetAPI",
         "invalid credId[c] or conn[" + kConnText + "] or empty account [a] /empty password"},
        {[] { return getDRNodeTempCredCreateAPI(kConn, "a", "", ""); },
         "getDRNodeTempCredCreateAPI",
         "invalid conn[" + kConnText + "] or empty account [a] /empty password"},
        {[] { return getDRNodeTempCredCreateAPI(kConn, ""); }, "getDRNodeTempCredCreateAPI",
         "invalid conn[" + kConnText + "]/empty session"},
        {[] { return getDRNodeTempCredReverseCreateAPI("", kConn); },
         "getDRNodeTempCredReverseCreateAPI", "Bad credId[]"},
    };
    for (const auto &each : cases) {
        LogCapture log;
        EXPECT_FALSE(each.build().isValid()) << each.message;
        ASSERT_EQ(log.lines().size(), each.message.empty() ? 0U : 1U) << each.message;
        if (!each.message.empty()) {
            EXPECT_EQ(log.count("ERR", "node_api", each.function, each.message), 1)
                << log.lines()[0];
        }
    }
}

TEST(NodeApi, RecognisesARelayedTestOfPrivilegeOnly) {
    EXPECT_TRUE(isRelayTestPrivilegeAPI(getDRNodeCredRelayAPI("c", getDRNodeTestPrivilegeAPI())));
    EXPECT_FALSE(isRelayTestPrivilegeAPI(getDRNodeTestPrivilegeAPI()));
    EXPECT_FALSE(isRelayTestPrivilegeAPI(getDRNodeCredRelayAPI("c", getDRNodeInfoAPI({}))));
    Request bent("OVRA.DR.Node.Credential", 1, "relay", Json::Value());
    EXPECT_FALSE(isRelayTestPrivilegeAPI(bent));
    bent.addParam("webapi", "not an object");
    EXPECT_FALSE(isRelayTestPrivilegeAPI(bent));
    EXPECT_FALSE(isRelayTestPrivilegeAPI(
        Request("OVRA.DR.Node.Credential", 1, "relay", Json::Value("no object"))));
}
