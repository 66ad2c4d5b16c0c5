// SPDX-License-Identifier: Apache-2.0

// The handling of every error number of the credential library, with a test double that fails on
// demand: the real library cannot be made to return them all.

#include "clock.h"
#include "support/local_node.h"
#include "support/log_capture.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"

#include <ovracredential/cred_request.h>
#include <ovradrcore/json.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>

#include <gtest/gtest.h>

#include <ctime>
#include <set>

struct _tag_ovra_cred_ {};
struct _tag_ovra_cred_sess_ {};

namespace {

/// The double's next behaviour.
struct Script {
    std::set<std::string> fail; ///< steps that fail
    int error = 0;
    int allocated = 0;
    int sent = 0;
    int probed = 0;
    int lookedUp = 0;
    std::int64_t now = 1'000'000'000'000; ///< every failed request takes 10 seconds
    long timeout = 0;
    int encryptMode = 0;
    std::string upload;
};
Script script;

int ok(const char *step) {
    return script.fail.count(step) == 0 ? 1 : 0;
}

} // namespace

OVRACred *OVRACredAlloc() {
    if (ok("alloc") == 0) {
        return nullptr;
    }
    ++script.allocated;
    return new _tag_ovra_cred_;
}
void OVRACredFree(OVRACred *cred) {
    --script.allocated;
    delete cred;
}
OVRACredSess *OVRACredSessAlloc() {
    if (ok("alloc sess") == 0) {
        return nullptr;
    }
    ++script.allocated;
    return new _tag_ovra_cred_sess_;
}
void OVRACredSessFree(OVRACredSess *sess) {
    --script.allocated;
    delete sess;
}
int OVRACredItemSetProtocol(OVRACred *, const char *) {
    return 1 - ok("protocol");
}
int OVRACredItemSetHost(OVRACred *, const char *) {
    return 1 - ok("host");
}
int OVRACredItemSetPort(OVRACred *, int) {
    return 1 - ok("port");
}
int OVRACredItemSetRemoteAccount(OVRACred *, const char *) {
    return 1 - ok("account");
}
int OVRACredItemSetRemotePasswd(OVRACred *, const char *) {
    return 1 - ok("passwd");
}
int OVRACredSessItemSetAccessToken(OVRACredSess *, const char *) {
    return 1 - ok("token");
}

namespace OVRA {
struct CredRequest::Impl {};
CredRequest::CredRequest() = default;
CredRequest::~CredRequest() = default;
int CredRequest::SetURL(const std::string &, const std::string &, int, const std::string &) {
    return ok("url");
}
int CredRequest::SetDefaultTimeout(long seconds) {
    EXPECT_EQ(seconds, 10) << "only probes set it";
    return ok("timeout");
}
int CredRequest::SetResponseTimeout(long seconds) {
    script.timeout = seconds;
    return 1;
}
int CredRequest::SetEncryptMode(int mode) {
    script.encryptMode = mode;
    return 1;
}
int CredRequest::SetUploadFile(const std::string &path, const std::string &name) {
    script.upload = path + " as " + name;
    return 1;
}
int CredRequest::CreateWebAPIRequest(CredRequest &, OVRACred *, OVRACredSess *, const std::string &,
                                     int, const std::string &, const Json::Value &) {
    return ok("create");
}
int CredRequest::Process(bool reuse, int mode) {
    EXPECT_TRUE(reuse);
    ++(mode == 2 ? script.probed : script.sent);
    const int done = mode == 2 ? ok("probe") : ok("process");
    script.now += done == 0 ? 10'000 : 0;
    return done;
}
std::string CredRequest::GetResponse() const {
    return R"({"success":true})";
}
int CredRequest::GetError() const {
    return script.error;
}
int CredRequestUtil::LoginWithOTP(OVRACred *, const std::string &, OVRACredSess *,
                                  Json::Value *out) {
    (*out)["success"] = ok("login answer") != 0;
    return ok("login");
}
int CredRequestUtil::Logout(OVRACred *, OVRACredSess *) {
    return 1;
}
int CredRequestFarlink::GetConnInfo(const std::string &alias, Json::Value &info, const void *) {
    ++script.lookedUp;
    info["host"] = alias + ".relay";
    info["protocol"] = "https";
    info["port"] = 6001;
    return 0; // the answer counts, not this
}
} // namespace OVRA

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

class CredError : public testing::Test {
protected:
    void SetUp() override {
        script = Script();
        ConnCache(conn).UpdateWithData(true);
    }
    int send(std::set<std::string> fail, int error = 0) {
        script.fail = std::move(fail);
        script.error = error;
        CredSessionSender sender(conn, "s");
        (void)sender.process(WebAPI::getDRNodeInfoAPI({})); // the code is what is looked at
        message = sender.GetErrMsg();
        return sender.GetErrCode();
    }
    int logIn(std::set<std::string> fail) {
        script.fail = std::move(fail);
        CredAccountSender sender(conn, "joe", "pw", "");
        (void)sender.init(); // the code is what is looked at
        return sender.GetErrCode();
    }

    Conn conn = Conn::https("h", 5001);
    Json::Value message;
    LogCapture log;
};

} // namespace

TEST_F(CredError, LibraryNumbersBecomeCodesAndOnlyLostConnectionsMarkTheEndpoint) {
    const struct {
        const char *step;
        int number;
        int code;
        const char *message;
        bool marked;
    } cases[] = {
        {"process", 4, 525, "null", false}, {"process", 6, 526, "null", false},
        {"process", 5, 500, "null", true},  {"process", 10, 500, "null", true},
        {"process", 1, 524, "1", false},    {"process", 99, 524, "99", false},
        {"process", 2, 524, "2", false},    {"process", 15, 524, "15", false},
        {"process", 0, 0, "null", false},   {"create", 7, 524, "7", false},
        {"create", 5, 500, "null", true},
    };
    for (const auto &each : cases) {
        ConnCache(conn).UpdateWithData(true);
        log.clear();
        EXPECT_EQ(send({each.step}, each.number), each.code) << each.step << each.number;
        EXPECT_EQ(OvraDRCore::toString(message), each.message) << each.step << each.number;
        EXPECT_EQ(ConnCache(conn).getStoredVerdict(), !each.marked) << each.step << each.number;
        EXPECT_EQ(log.count("Update conn cache"), each.marked ? 1 : 0);
        EXPECT_EQ(log.count("cred error [" + std::to_string(each.number) + "]"),
                  each.number == 0 ? 0 : 1);
    }
    EXPECT_EQ(script.allocated, 0) << "every handle was freed";
}

TEST_F(CredError, EveryStepBeforeSendingHasItsCode) {
    EXPECT_EQ(send({"alloc"}), 402);
    EXPECT_EQ(send({"alloc sess"}), 402);
    for (const char *item : {"protocol", "host", "port", "token"}) {
        EXPECT_EQ(send({item}), 506) << item;
    }
    EXPECT_EQ(logIn({"account"}), 506);
    EXPECT_EQ(logIn({"passwd"}), 506);
    EXPECT_EQ(log.count("ERR", "sender", "initCred",
                        "Failed to set the credential infomation of host [joe]"),
              2);
    EXPECT_EQ(logIn({"login", "login answer"}), 501) << "the mapped answer replaces 523";
    EXPECT_EQ(logIn({"login"}), 523) << "it stays when the answer is a success";
    EXPECT_EQ(script.sent, 0);
    EXPECT_EQ(script.allocated, 0);
}

TEST_F(CredError, TheRequestSaysHowItTravels) {
    OvraDRCore::Request request = WebAPI::getDRNodeInfoAPI({});
    request.setEncryptRequired(true);
    request.setResponseTimeout(17);
    request.setUpload("/a", "b");
    EXPECT_TRUE(CredSessionSender(conn, "s").process(request).isSuccess());
    EXPECT_EQ(script.encryptMode, 2);
    EXPECT_EQ(script.timeout, 17);
    EXPECT_EQ(script.upload, "/a as b");
    script = Script();
    request.setEncryptRequired(false);
    request.setUpload("/a", "");
    EXPECT_TRUE(CredSessionSender(conn, "s").process(request).isSuccess());
    EXPECT_EQ(script.encryptMode, 0);
    EXPECT_EQ(script.upload, "") << "both or neither";
}

TEST_F(CredError, ARelayEndpointIsResolvedBeforeUse) {
    CredSessionSender sender(Conn::farlink("alias"), "s");
    EXPECT_TRUE(sender.getConn() == Conn::https("alias.relay", 6001));
    EXPECT_FALSE(sender.setConn(Conn()));
    EXPECT_TRUE(sender.getConn() == Conn::https("alias.relay", 6001)) << "the old one stays";
}

TEST_F(CredError, AProbeThatSaysNothingOfTheEndpointLeavesTheVerdictOfARefresh) {
    const std::string text = OvraDRCore::toString(conn.toJson());
    const struct {
        const char *step;
        int number;
        bool kept; ///< also by a probe that was asked for
    } cases[] = {{"url", 1, false}, {"timeout", 1, false}, {"probe", 2, true}};
    for (const auto &each : cases) {
        script.fail = {each.step};
        script.error = each.number;
        const std::time_t old = std::time(nullptr) - 100;
        ConnCache(conn).UpdateWithData(true, old, old);
        EXPECT_TRUE(BaseSender::GetCachedConnectable(conn)) << each.step;
        EXPECT_GT(ConnCache(conn).GetCachedAge(), 99) << each.step << ": it is still the old one";
        EXPECT_FALSE(BaseSender::IsConnectable(conn)) << each.step;
        EXPECT_EQ(ConnCache(conn).getStoredVerdict(), each.kept) << each.step;
    }
    for (const std::string step : {"url", "timeout"}) {
        EXPECT_EQ(log.count("ERR", "sender", "IsConnectableWithErrCheck",
                            "Failed to set " + step + " of conn [" + text + "]"),
                  2);
    }
    EXPECT_EQ(log.count("Failed to check connectable of conn[" + text + "]"), 2);
}

TEST_F(CredError, OneRequestAsksASilentEndpointOnceHoweverManyCredentialsItHas) {
    const struct {
        const char *step;
        int number;
        int probed;
        int sent;
        int code;
    } cases[] = {
        {"probe", 10, 2, 0, 500},
        {"process", 10, 2, 2, 500},
        {"process", 15, 2, 2, 524}, // the request may have arrived: 500 would deny it
    };
    OvraDRCore::setSystemClock([] { return script.now; });
    provisionNode();
    for (int i = 0; i < 6; ++i) {
        addCred("temp_cred", "n1", "t" + std::to_string(i), "https", 5001 + i % 2, "s");
    }
    for (const auto &each : cases) {
        script = Script{{each.step}, each.number};
        NodeValidCredCache("n1").UpdateWithData("t0");
        NodeSender sender("n1");
        EXPECT_FALSE(sender.process(WebAPI::getDRNodeInfoAPI({})).isValid());
        EXPECT_EQ(script.probed, each.probed) << each.step << each.number;
        EXPECT_EQ(script.sent, each.sent) << each.step << each.number;
        EXPECT_EQ(sender.GetErrCode(), each.code) << each.step << each.number;
        executeSql("UPDATE temp_cred SET port = port + 2");
    }
    const Conn relayed("127.0.0.1", "flk", 443);
    addCred("node_cred", "n2", "c9", "flk", 443, "s");
    ConnCache(relayed).UpdateWithData(false);
    script = Script{{}, 0, 0, 0, 0, 0, script.now};
    CredNodeSender sender("c9");
    EXPECT_FALSE(sender.process(WebAPI::getDRNodeInfoAPI({})).isValid());
    EXPECT_EQ(sender.GetErrMsg(), relayed.toJson());
    EXPECT_EQ(script.lookedUp, 0) << "the relay service is not asked where a dead alias is";
    OvraDRCore::setSystemClock(nullptr);
}
