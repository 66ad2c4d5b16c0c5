// SPDX-License-Identifier: Apache-2.0

// The handling of every error number of the credential library, with its stand-in that fails on
// demand: the real library cannot be made to return them all.

#include "support/node_fixture.h"
#include "support/vendor/stand_in.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"

#include <ovradrnode/cred_permission_cache.h>

#include <ctime>

using namespace OvraDRNode;
using namespace OvraTest;
using OvraVendor::credentialLibrary;

namespace {

class CredError : public LocalNode {
protected:
    CredError() {
        remote.sessions = {"s"};
        remote.answer = [](const auto &) { return OvraPlatform::apiSuccess(); };
        credentialLibrary.fault = [this](const std::string &operation) {
            ++asked[operation];
            const bool fails = failing.count(operation) != 0;
            now += fails && (operation == "Process" || operation == "probe") ? 10'000 : 0;
            return fails ? std::optional(error) : std::nullopt;
        };
        ConnCache(conn).UpdateWithData(true);
    }
    ~CredError() override {
        EXPECT_EQ(credentialLibrary.credentials + credentialLibrary.sessions, 0);
    }
    void fail(const std::set<std::string> &operations, int number = 0) {
        failing = operations;
        error = number;
        asked.clear();
    }
    int send(const std::set<std::string> &operations, int number = 0) {
        fail(operations, number);
        CredSessionSender sender(conn, "s");
        (void)sender.process(info); // the code is what is looked at
        message = sender.GetErrMsg();
        return sender.GetErrCode();
    }
    int logIn(const std::set<std::string> &operations, const std::string &password = "pw") {
        fail(operations);
        CredAccountSender sender(conn, "joe", password, "");
        (void)sender.init(); // the code is what is looked at
        return sender.GetErrCode();
    }

    Conn conn = Conn::https("h", 5001);
    OvraVendor::Remote &remote = credentialLibrary.remotes["https://h:5001"];
    std::set<std::string> failing;
    int error = 0;
    std::map<std::string, int> asked;
    Json::Value message;
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
        {"Process", 4, 525, "null", false},
        {"Process", 6, 526, "null", false},
        {"Process", 5, 500, "null", true},
        {"Process", 10, 500, "null", true},
        {"Process", 1, 524, "1", false},
        {"Process", 99, 524, "99", false},
        {"Process", 2, 524, "2", false},
        {"Process", 15, 524, "15", false},
        {"Process", 0, 0, "null", false},
        {"CreateWebAPIRequest", 7, 524, "7", false},
        {"CreateWebAPIRequest", 5, 500, "null", true},
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
}

TEST_F(CredError, AProcessThatWasStoppedInItsRequestHasOldNews) {
    stopClock();
    for (const bool otherMeanwhile : {false, true}) {
        ConnCache(conn).UpdateWithData(true);
        credentialLibrary.fault = [&](const std::string &operation) -> std::optional<int> {
            if (operation != "Process") {
                return std::nullopt;
            }
            now += 100'000;
            EXPECT_TRUE(!otherMeanwhile || ConnCache(conn).UpdateWithData(true));
            now += 20'000;
            return 5;
        };
        CredSessionSender sender(conn, "s");
        EXPECT_FALSE(sender.process(info).isValid());
        EXPECT_EQ(sender.GetErrCode(), 500);
        EXPECT_EQ(ConnCache(conn).getStoredVerdict(), otherMeanwhile);
        EXPECT_EQ(ConnCache(conn).GetCachedAge(), otherMeanwhile ? 20 : 109);
    }
}

TEST_F(CredError, ARightThatAStoppedProcessLearntOfReplacesNoYoungerOne) {
    stopClock();
    addCred("node_cred", "n1", "c1", "https", 5001, "s");
    credentialLibrary.remotes["https://127.0.0.1:5001"] = remote;
    const CredPermissionCache permission("c1");
    const NodeValidCredCache works("n1");
    for (const bool answered : {false, true}) {
        for (const bool otherMeanwhile : {false, true}) {
            ConnCache(Conn::https("127.0.0.1", 5001)).UpdateWithData(true);
            EXPECT_TRUE(works.UpdateWithData("c1") && permission.UpdateWithData(true));
            credentialLibrary.fault = [&](const std::string &operation) -> std::optional<int> {
                if (operation != "Process") {
                    return std::nullopt;
                }
                now += 100'000;
                EXPECT_TRUE(!otherMeanwhile ||
                            (permission.UpdateWithData(!answered) && works.UpdateWithData("c2")));
                now += 20'000;
                return answered ? std::nullopt : std::optional(9);
            };
            NodeSender sender("n1");
            EXPECT_EQ(sender.process(info).isSuccess(), answered);
            EXPECT_EQ(permission.GetCachedHasPrivilege(), otherMeanwhile ? !answered : answered);
            EXPECT_EQ(permission.GetCachedAge(), otherMeanwhile ? 20 : 109);
            EXPECT_EQ(works.getStoredCredId(), otherMeanwhile ? "c2" : "c1");
        }
    }
}

TEST_F(CredError, EveryStepBeforeSendingHasItsCode) {
    EXPECT_EQ(send({"OVRACredAlloc"}), 402);
    EXPECT_EQ(send({"OVRACredSessAlloc"}), 402);
    for (const char *item : {"OVRACredItemSetProtocol", "OVRACredItemSetHost",
                             "OVRACredItemSetPort", "OVRACredSessItemSetAccessToken"}) {
        EXPECT_EQ(send({item}), 506) << item;
    }
    EXPECT_EQ(logIn({"OVRACredItemSetRemoteAccount"}), 506);
    EXPECT_EQ(logIn({"OVRACredItemSetRemotePasswd"}), 506);
    EXPECT_EQ(log.count("ERR", "sender", "initCred",
                        "Failed to set the credential infomation of host [joe]"),
              2);
    EXPECT_EQ(logIn({"LoginWithOTP"}, "no"), 501) << "the mapped answer replaces 523";
    EXPECT_EQ(logIn({"LoginWithOTP"}), 523) << "it stays when the answer is a success";
    EXPECT_TRUE(remote.calls.empty());
}

TEST_F(CredError, TheRequestSaysHowItTravels) {
    OvraDRCore::Request request = WebAPI::getDRNodeInfoAPI({});
    request.setEncryptRequired(true);
    request.setResponseTimeout(17);
    request.setUpload("/a", "b");
    EXPECT_TRUE(CredSessionSender(conn, "s").process(request).isSuccess());
    request.setEncryptRequired(false);
    request.setUpload("/a", "");
    EXPECT_TRUE(CredSessionSender(conn, "s").process(request).isSuccess());
    ASSERT_EQ(remote.calls.size(), 2U);
    EXPECT_TRUE(remote.calls[0].reused && remote.calls[0].sealed && !remote.calls[1].sealed);
    EXPECT_EQ(remote.calls[0].timeout, 17);
    EXPECT_EQ(remote.calls[0].uploads, std::vector<std::string>{"/a as b"});
    EXPECT_TRUE(remote.calls[1].uploads.empty()) << "both or neither";
}

TEST_F(CredError, ARelayEndpointIsResolvedBeforeUse) {
    fail({"GetConnInfo"}); // the answer counts, not this
    credentialLibrary.relay["alias"] = Conn::https("alias.relay", 6001).toJson();
    credentialLibrary.relay["alias"]["host"] = "alias.relay";
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
    } cases[] = {{"SetURL", 1, false}, {"SetDefaultTimeout", 1, false}, {"probe", 2, true}};
    for (const auto &each : cases) {
        fail({each.step}, each.number);
        const std::time_t old = std::time(nullptr) - 100;
        ConnCache(conn).UpdateWithData(true, old, old);
        EXPECT_TRUE(BaseSender::GetCachedConnectable(conn)) << each.step;
        EXPECT_GT(ConnCache(conn).GetCachedAge(), 99) << each.step << ": it is still the old one";
        EXPECT_FALSE(BaseSender::IsConnectable(conn)) << each.step;
        EXPECT_EQ(ConnCache(conn).getStoredVerdict(), each.kept) << each.step;
    }
    EXPECT_EQ(log.count("Failed to set url of conn [" + text + "]"), 2);
    EXPECT_EQ(log.count("Failed to set timeout of conn [" + text + "]"), 2);
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
        {"Process", 10, 2, 2, 500},
        {"Process", 15, 2, 2, 524}, // the request may have arrived: 500 would deny it
    };
    stopClock();
    for (int i = 0; i < 6; ++i) {
        const int port = 5001 + i;
        credentialLibrary.remotes["https://127.0.0.1:" + std::to_string(port)] = remote;
        addCred("temp_cred", "n1", "t" + std::to_string(i), "https", 5001 + i % 2, "s");
    }
    for (const auto &each : cases) {
        fail({each.step}, each.number);
        NodeValidCredCache("n1").UpdateWithData("t0");
        NodeSender sender("n1");
        EXPECT_FALSE(sender.process(info).isValid());
        EXPECT_EQ(asked["probe"], each.probed) << each.step << each.number;
        EXPECT_EQ(asked["Process"], each.sent) << each.step << each.number;
        EXPECT_EQ(sender.GetErrCode(), each.code) << each.step << each.number;
        executeSql("UPDATE temp_cred SET port = port + 2");
    }
    const Conn relayed("127.0.0.1", "flk", 443);
    addCred("node_cred", "n2", "c9", "flk", 443, "s");
    ConnCache(relayed).UpdateWithData(false);
    fail({});
    CredNodeSender sender("c9");
    EXPECT_FALSE(sender.process(info).isValid());
    EXPECT_EQ(sender.GetErrMsg(), relayed.toJson());
    EXPECT_EQ(asked["GetConnInfo"], 0) << "the relay service is not asked where a dead alias is";
}
