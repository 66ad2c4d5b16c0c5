// SPDX-License-Identifier: Apache-2.0
#include "support/log_capture.h"

#include <ovradrcore/json.h>
#include <ovradrnode/node_api.h>

#include <gtest/gtest.h>

#include <functional>
#include <map>

using namespace OvraDRNode;
using namespace OvraDRNode::WebAPI;

namespace {

/// The arguments of all builders, each acceptable.
struct Arguments {
    Conn conn = Conn::https("h", 5001);
    std::string credId = "c", account = "a", password = "p", otp = "1", session = "s",
                direction = "d", nodeId = "n", url = "u", user = "joe";
    int retries = 0, timeout = 3;
    Request request = getDRNodeCredSetAPI("c", conn, "a", "pw", "");
};
using A = const Arguments &;

/// Takes one argument away.
const std::map<char, std::function<void(Arguments &)>> kMissing = {
    {'c', [](Arguments &a) { a.conn.port = -1; }},
    {'i', [](Arguments &a) { a.credId = ""; }},
    {'a', [](Arguments &a) { a.account = ""; }},
    {'p', [](Arguments &a) { a.password = ""; }},
    {'s', [](Arguments &a) { a.session = ""; }},
    {'d', [](Arguments &a) { a.direction = ""; }},
    {'n', [](Arguments &a) { a.nodeId = ""; }},
    {'u', [](Arguments &a) { a.url = a.user = ""; }},
    {'r', [](Arguments &a) { a.retries = -1; }},
    {'t', [](Arguments &a) { a.timeout = -1; }},
    {'q', [](Arguments &a) { a.request.setMethod(""); }},
};

/// The text with the values of the arguments in the places of their names.
std::string filled(std::string text, A a) {
    const std::pair<const char *, std::string> values[] = {
        {"{conn}", OvraDRCore::toString(a.conn.toJson())},
        {"{credId}", a.credId},
        {"{account}", a.account},
        {"{direction}", a.direction},
        {"{nodeId}", a.nodeId},
        {"{url}", a.url},
        {"{retries}", std::to_string(a.retries)},
        {"{timeout}", std::to_string(a.timeout)},
        {"{masked}", OvraDRCore::toLogString(a.request.toJson())},
        {"{request}", OvraDRCore::toString(a.request.toJson())}};
    for (const auto &[name, value] : values) {
        for (std::size_t at = 0; (at = text.find(name)) != std::string::npos;) {
            text.replace(at, std::string(name).size(), value);
        }
    }
    return text;
}

} // namespace

/// The name of a builder, and its call.
#define BUILT_BY(builder, ...)                                                                     \
#builder, [](A a) { (void)a; return builder(__VA_ARGS__); }

TEST(NodeApi, EveryRequestOfTheCatalogue) {
    const struct {
        const char *function;
        std::function<Request(A)> build;
        std::string call, params;
        std::string needs, refusal; ///< keys of kMissing, and what is logged without one of them
    } cases[] = {
        {BUILT_BY(OvraCoreUserGetAPI, a.user), "OVRA.Core.User get 1", R"({"name":"joe"})", "u",
         ""},
        {BUILT_BY(getDRNodeSessionCreateAPI, a.nodeId), "OVRA.DR.Node.Session create 2",
         R"({"node_id":"n"})", "n", "Bad nodeId[]"},
        {BUILT_BY(getDRNodeSessionTempCreateAPI), "OVRA.DR.Node.Session temp_create 1", R"({})", "",
         ""},
        {BUILT_BY(getDRNodeSessionDeleteAPI, a.session), "OVRA.DR.Node.Session delete 1",
         R"({"session":"s"})", "s", "Bad sessionId"},
        {BUILT_BY(getDRNodeSessionGetAPI, a.session), "OVRA.DR.Node.Session get 1",
         R"({"session":"s"})", "s", ""},
        {BUILT_BY(getDRNodeInfoAPI, {}), "OVRA.DR.Node info 1", R"({})", "", ""},
        {BUILT_BY(getDRNodeInfoAPI, {"b", "a"}), "OVRA.DR.Node info 1",
         R"({"additional":["b","a"]})", "", ""},
        {BUILT_BY(getDRNodeTestPrivilegeAPI), "OVRA.DR.Node test_privilege 1", R"({})", "", ""},
        {BUILT_BY(getDRNodeTestConnectionAPI, {Conn(), a.conn}), "OVRA.DR.Node test_connection 1",
         R"({"conns":[{conn}]})", "c", "Empty connections"},
        {BUILT_BY(getDRNodeTestSyncSpeedAPI, a.nodeId, a.retries, a.timeout),
         "OVRA.DR.Node test_sync_speed 1", R"({"node_id":"n","retries":0,"timeout":3})", "nrt",
         "invalid nodeId[{nodeId}], retries[{retries}], or timeout[{timeout}]"},
        {BUILT_BY(getDRNodeTestDownloadSpeedAPI, a.url, a.retries, a.timeout),
         "OVRA.DR.Node test_download_speed 1", R"({"retries":0,"timeout":3,"url":"u"})", "urt",
         "invalid url[{url}], retries[{retries}], or timeout[{timeout}]"},
        {BUILT_BY(getDRNodeCredCreateAPI, a.conn, a.session, a.direction),
         "OVRA.DR.Node.Credential create 1 sealed",
         R"({"auth":"session","conn":{conn},"cred_direction":"d","session":"s"})", "csd",
         "invalid conn[{conn}]/empty session or bad credType[{direction}]"},
        {BUILT_BY(getDRNodeCredCreateAPI, a.conn, a.account, a.password, a.otp, a.direction),
         "OVRA.DR.Node.Credential create 1 sealed",
         R"({"account":"a","auth":"account","conn":{conn},"cred_direction":"d",)"
         R"("otpcode":"1","password":"p"})",
         "capd",
         "Invalid conn[{conn}] or empty account[{account}]/password or bad credType[{direction}]"},
        {BUILT_BY(getDRNodeCredCreateAPI, a.credId), "OVRA.DR.Node.Credential create 1",
         R"({"auth":"cred_id","cred_direction":"unidirection","cred_id":"c"})", "i",
         "Invalid credId[]"},
        {BUILT_BY(getDRNodeCredGetAPI, a.credId), "OVRA.DR.Node.Credential get 1",
         R"({"cred_id":"c"})", "i", "credId[]"},
        {BUILT_BY(getDRNodeCredSetAPI, a.credId, a.conn, a.account, a.password, a.otp),
         "OVRA.DR.Node.Credential set 1 sealed",
         R"({"account":"a","addr":"h","cred_id":"c","otpcode":"1","password":"p",)"
         R"("port":5001,"protocol":"https"})",
         "icap", "empty conn[{conn}] or empty account[{account}]/password/credId[{credId}]"},
        {BUILT_BY(getDRNodeCredRelayAPI, a.credId, a.request), "OVRA.DR.Node.Credential relay 1",
         R"({"cred_id":"c","webapi":{request}})", "iq",
         "Invalid credId [{credId}] or relayAPI [{masked}]"},
        {BUILT_BY(getDRNodeCredReverseCreateAPI, a.credId, a.conn),
         "OVRA.DR.Node.Credential reverse_create 1", R"({"conn":{conn},"cred_id":"c"})", "i",
         "Bad credId[]"},
        {BUILT_BY(getDRNodeTestCredReverseCreateAPI, a.credId, a.conn),
         "OVRA.DR.Node.Credential test_reverse_create 1", R"({"conn":{conn},"cred_id":"c"})", "i",
         "Bad credId []"},
        {BUILT_BY(getDRNodeTempCredReverseCreateAPI, a.credId, a.conn),
         "OVRA.DR.Node.Credential temp_reverse_create 1", R"({"conn":{conn},"cred_id":"c"})", "i",
         "Bad credId[]"},
        {BUILT_BY(getDRNodeTestCredCreateAPI, a.conn, a.account, a.session),
         "OVRA.DR.Node.Credential test_create 1 sealed",
         R"({"account":"a","auth":"session","conn":{conn},"session":"s"})", "cas",
         "invalid conn[{conn}] or empty account [{account}] /empty session"},
        {BUILT_BY(getDRNodeTestCredCreateAPI, a.conn, a.account, a.password, a.otp),
         "OVRA.DR.Node.Credential test_create 1 sealed",
         R"({"account":"a","auth":"account","conn":{conn},"otpcode":"1","password":"p"})", "cap",
         "invalid conn[{conn}] or empty account [{account}] /empty password"},
        {BUILT_BY(getDRNodeTestCredSetAPI, a.credId, a.conn, a.account, a.password, a.otp),
         "OVRA.DR.Node.Credential test_set 1 sealed",
         R"({"account":"a","addr":"h","cred_id":"c","otpcode":"1","password":"p",)"
         R"("port":5001,"protocol":"https"})",
         "icap",
         "invalid credId[{credId}] or conn[{conn}] or empty account [{account}] /empty password"},
        {BUILT_BY(getDRNodeTempCredCreateAPI, a.conn, a.account, a.password, a.otp),
         "OVRA.DR.Node.Credential temp_create 1 sealed",
         R"({"account":"a","auth":"account","conn":{conn},"otpcode":"1","password":"p"})", "cap",
         "invalid conn[{conn}] or empty account [{account}] /empty password"},
        {BUILT_BY(getDRNodeTempCredCreateAPI, a.conn, a.session),
         "OVRA.DR.Node.Credential temp_create 1 sealed",
         R"({"auth":"session","conn":{conn},"session":"s"})", "cs",
         "invalid conn[{conn}]/empty session"},
    };
    for (const auto &each : cases) {
        const std::string where = each.function + each.params;
        const Request request = each.build({});
        EXPECT_TRUE(request.isValid()) << where;
        EXPECT_EQ(request.getAPI() + " " + request.getMethod() + " " +
                      std::to_string(request.getVersion()) +
                      (request.isEncryptRequired() ? " sealed" : ""),
                  each.call);
        EXPECT_EQ(OvraDRCore::toString(request.getParams()), filled(each.params, {}));
        for (const char missing : each.needs) {
            Arguments arguments;
            kMissing.at(missing)(arguments);
            LogCapture log;
            EXPECT_FALSE(each.build(arguments).isValid()) << where << " without " << missing;
            const std::string message = filled(each.refusal, arguments);
            EXPECT_EQ(log.count("ERR", "node_api", each.function, message), message.empty() ? 0 : 1)
                << where << " without " << missing;
            EXPECT_EQ(log.lines().size(), message.empty() ? 0U : 1U) << where;
        }
        Arguments fewer;
        fewer.otp = "";
        EXPECT_FALSE(each.build(fewer).getParams().isMember("otpcode")) << where;
    }
    for (const Request &request : {getDRNodeCredReverseCreateAPI("c", Conn()),
                                   getDRNodeTestCredReverseCreateAPI("c", Conn()),
                                   getDRNodeTempCredReverseCreateAPI("c", Conn())}) {
        EXPECT_EQ(OvraDRCore::toString(request.getParams()), R"({"cred_id":"c"})");
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
