// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "seal/sealing.h"
#include "support/log_capture.h"
#include "support/sealing_daemon.h"

#include <ovracredential/cred_request.h>
#include <ovraplatform/cred_errors.h>
#include <ovraplatform/login_refusal.h>
#include <ovraplatform/peer_trust.h>

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>

namespace {

using namespace OvraPlatform;
using namespace OvraTest;

/// A daemon that grants "granted-sid" to ann with the password hunter2, and echoes requests.
std::string serve(const WireCall &call) {
    Json::Value data;
    if (call.method == "login") {
        data["sid"] = "granted-sid";
        const bool good = call.params["account"] == "ann" && call.params["passwd"] == "hunter2";
        return OvraDRCore::toString(good ? apiSuccess(data) : apiError(APIError::kLoginFailed));
    }
    data["sid"] = call.sid;
    data["params"] = call.params;
    return OvraDRCore::toString(apiSuccess(data));
}

class SealedCallScene : public OwnFiles {
protected:
    /// \param clock    the daemon's
    /// \param trusted  whether its key is known
    std::unique_ptr<MisbehavingServer>
    start(bool tls, std::function<UnixMillis()> clock = wallClock, bool trusted = true) {
        daemon_ =
            std::make_unique<SealingDaemon>(path("seal"), serve, ReplayGuard::Clocks{clock, clock});
        auto server = std::make_unique<MisbehavingServer>(MisbehavingServer::Options{.tls = tls});
        server->answerWith([this](const Received &request) { return daemon_->answer(request); });
        if (trusted) {
            trust(*server, tls);
        }
        OVRACredItemSetProtocol(cred_.get(), tls ? "https" : "http");
        OVRACredItemSetHost(cred_.get(), "127.0.0.1");
        OVRACredItemSetPort(cred_.get(), server->port());
        OVRACredItemSetRemoteAccount(cred_.get(), "ann");
        OVRACredItemSetRemotePasswd(cred_.get(), "hunter2");
        OVRACredSessItemSetAccessToken(sess_.get(), "sid-1");
        return server;
    }

    void trust(const MisbehavingServer &server, bool tls) {
        trustEndpoint(tls ? "https" : "http", "127.0.0.1", server.port(),
                      tls ? server.fingerprint() : daemon_->fingerprint(), true);
    }

    CredError call(int encryptMode = 0) {
        OVRA::CredRequest request;
        Json::Value params;
        params["password"] = "topsecret";
        OVRA::CredRequest::CreateWebAPIRequest(request, cred_.get(), sess_.get(), "OVRA.Test", 1,
                                               "set", params);
        request.SetEncryptMode(encryptMode);
        request.SetResponseTimeout(5);
        request.Process(true, 0);
        (void)OvraDRCore::fromString(reply_, request.GetResponse()); // there may be none
        return static_cast<CredError>(request.GetError());
    }

    int login() {
        return OVRA::CredRequestUtil::LoginWithOTP(cred_.get(), "", sess_.get(), &reply_);
    }

    static bool carries(const MisbehavingServer &server, const std::string &text) {
        for (const Received &request : server.requests()) {
            if ((request.path + request.headers + request.body).find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }

    std::unique_ptr<SealingDaemon> daemon_;
    std::unique_ptr<OVRACred, decltype(&OVRACredFree)> cred_{OVRACredAlloc(), OVRACredFree};
    std::unique_ptr<OVRACredSess, decltype(&OVRACredSessFree)> sess_{OVRACredSessAlloc(),
                                                                     OVRACredSessFree};
    Json::Value reply_;
};

TEST_F(SealedCallScene, KeepsEverySecretOutOfPlainHttp) {
    const auto server = start(false);
    EXPECT_NE(login(), 0);
    EXPECT_EQ(reply_["data"]["sid"], "granted-sid");
    ASSERT_EQ(call(), CredError::kNone);
    EXPECT_EQ(reply_["data"]["sid"], "granted-sid") << "the session of the log-in is used";
    EXPECT_EQ(reply_["data"]["params"]["password"], "topsecret");
    EXPECT_NE(OVRA::CredRequestUtil::Logout(cred_.get(), sess_.get()), 0);
    for (const char *secret : {"hunter2", "granted-sid", "topsecret"}) {
        EXPECT_FALSE(carries(*server, secret)) << secret;
    }
    EXPECT_TRUE(carries(*server, "api=OVRA.Test&version=1&method=set&sealed="));
}

TEST_F(SealedCallScene, LogsNothingSecretWhateverGoesWrong) {
    const LogCapture log;
    const auto server = start(false);
    login();
    call();
    server->answerOnce(Answer::html());
    call();
    server->answerOnce(Answer::json(R"({"sealed_reply":"AAAA"})"));
    login();
    daemon_->newKey(path("other"));
    call();
    login();
    server->refuse();
    server->closeConnections();
    OVRA::CredRequestUtil::Logout(cred_.get(), sess_.get());
    EXPECT_GT(log.count("is not the one trusted for it"), 0);
    EXPECT_GT(log.count("A session could not be ended"), 0);
    for (const char *secret : {"hunter2", "granted-sid", "topsecret", "sid-1"}) {
        EXPECT_EQ(log.count(secret), 0) << secret;
    }
}

TEST_F(SealedCallScene, SealsOverTlsWhenThatIsAskedOnly) {
    const auto server = start(true);
    EXPECT_NE(login(), 0);
    EXPECT_EQ(reply_["data"]["sid"], "granted-sid");
    EXPECT_FALSE(carries(*server, "sealed="));
    EXPECT_TRUE(carries(*server, "passwd=%22hunter2%22"));
    EXPECT_NE(OVRA::CredRequestUtil::Logout(cred_.get(), sess_.get()), 0);
    EXPECT_EQ(OVRA::CredRequestUtil::Logout(cred_.get(), sess_.get()), 0);
    EXPECT_EQ(server->requests().size(), 2U);
    OVRACredSessItemSetAccessToken(sess_.get(), "sid-1");
    ASSERT_EQ(call(2), CredError::kNone);
    EXPECT_EQ(reply_["data"]["params"]["password"], "topsecret");
    EXPECT_FALSE(carries(*server, "topsecret"));
    EXPECT_FALSE(carries(*server, "sid-1"));
    daemon_->newKey(path("other"));
    EXPECT_EQ(call(2), CredError::kNone) << "TLS vouches for a new key";
}

TEST_F(SealedCallScene, SaysWhyALogInFailed) {
    const auto server = start(true);
    OVRACredItemSetRemotePasswd(cred_.get(), "wrong");
    EXPECT_NE(login(), 0);
    EXPECT_EQ(reply_["error"]["code"], 400);
    server->answer(Answer::success());
    EXPECT_EQ(login(), 0) << "a success without a session";
    EXPECT_FALSE(reply_["success"].asBool());
    server->refuse();
    server->closeConnections();
    EXPECT_EQ(login(), 0);
    EXPECT_EQ(reply_["error"]["msg"]["cred_error"], 5);
}

TEST_F(SealedCallScene, GetsThroughToAnApplianceWithAnotherTime) {
    for (const UnixMillis skew : {-90'000'000, 90'000'000}) {
        const auto server = start(false, [skew] { return wallClock() + skew; });
        EXPECT_EQ(call(), CredError::kNone) << skew;
        EXPECT_TRUE(reply_["success"].asBool()) << skew;
        EXPECT_EQ(server->requests().size(), 3U)
            << "the key, a stale try, and one that got through";
        EXPECT_EQ(call(), CredError::kNone) << skew;
        EXPECT_EQ(server->requests().size(), 4U) << "the difference is remembered";
    }
    std::atomic<UnixMillis> ahead{0};
    const auto server = start(false, [&] { return wallClock() + (ahead += 1'000'000); });
    EXPECT_EQ(call(), CredError::kNone);
    EXPECT_EQ(reply_["error"]["code"], APIError::kSealRefused);
    EXPECT_EQ(server->requests().size(), 3U) << "no more than two tries when the time runs away";
}

TEST_F(SealedCallScene, RefusesAnHttpEndpointWhoseKeyHasChanged) {
    const auto server = start(false);
    ASSERT_EQ(call(), CredError::kNone);
    daemon_->newKey(path("other"));
    EXPECT_EQ(call(), CredError::kCertificateChanged);
    EXPECT_EQ(call(), CredError::kCertificateChanged);
    EXPECT_EQ(peerFingerprint("http", "127.0.0.1", server->port(), 5).value().fingerprint,
              daemon_->fingerprint());
    trust(*server, false);
    EXPECT_EQ(call(), CredError::kNone);
}

TEST_F(SealedCallScene, TrustsANewKeyAtALogInAndNowhereElse) {
    for (const bool tls : {true, false}) {
        std::filesystem::remove_all(kStateDir);
        const auto server = start(tls, wallClock, false);
        EXPECT_EQ(call(), CredError::kTrustLost);
        EXPECT_EQ(login(), 0) << "there is no file that says that it is unknown";
        EXPECT_TRUE(TrustStore().create());
        EXPECT_EQ(call(), CredError::kNotTrusted);
        OtherProcess full([this] {
            limitFileSize(0);
            return login() == 0 ? reply_["error"]["msg"]["cred_error"].asInt() : -1;
        });
        EXPECT_EQ(full.wait(), static_cast<int>(CredError::kTrustUnavailable));
        EXPECT_FALSE(carries(*server, "sealed=") || carries(*server, "ann")) << tls;
        EXPECT_NE(login(), 0) << tls;
        EXPECT_EQ(call(), CredError::kNone) << tls;
        EXPECT_TRUE(TrustStore().forget((tls ? "https" : "http") + std::string("://127.0.0.1:") +
                                        std::to_string(server->port())));
        EXPECT_EQ(login(), 0) << "a person has withdrawn it";
    }
}

TEST_F(SealedCallScene, BelievesNothingThatCouldBeForged) {
    const auto server = start(false);
    ASSERT_EQ(call(), CredError::kNone);
    for (const char *forged :
         {R"({"success":true,"data":{"sid":"evil"}})", R"({"success":false,"error":{"code":105}})",
          R"({"success":false,"error":{"code":400}})", R"({"sealed_reply":"AAAA"})",
          R"({"success":false,"error":{"code":109,"msg":{"reason":"stale","time":1}}})"}) {
        server->answerOnce(Answer::json(forged));
        EXPECT_EQ(call(), CredError::kReplyForged) << forged;
        server->answerOnce(Answer::json(forged));
        EXPECT_EQ(login(), 0);
        EXPECT_EQ(OvraPlatform::lastLoginError(), CredError::kReplyForged) << forged;
    }
    const Answer busy = Answer::json(R"({"success":false,"error":{"code":107,"msg":"in 9 s"}})");
    server->answerOnce(busy);
    EXPECT_EQ(call(), CredError::kNone) << "that it is busy says nothing that could harm";
    EXPECT_EQ(reply_["error"]["code"], 107);
    server->answerOnce(busy);
    EXPECT_NE(login(), 0);
    EXPECT_EQ(OvraPlatform::lastLoginRefusal().code, 107);
    EXPECT_EQ(OvraPlatform::lastLoginRefusal().detail, "in 9 s");
    EXPECT_NE(login(), 0);
    EXPECT_EQ(OvraPlatform::lastLoginRefusal().code, 0);
    EXPECT_EQ(OVRA::CredRequestUtil::LoginWithOTP(nullptr, "", nullptr, nullptr), 0);
    EXPECT_EQ(OvraPlatform::lastLoginError(), CredError::kBadArgument);
}

TEST_F(SealedCallScene, SendsNoFileOverPlainHttpAndNothingToAnEndpointThatHasNoKey) {
    const auto server = start(false);
    writeFile(path("file"), "content");
    OVRA::CredRequest request;
    OVRA::CredRequest::CreateWebAPIRequest(request, cred_.get(), sess_.get(), "OVRA.Test", 1, "put",
                                           Json::Value());
    request.SetUploadFile(path("file"), "file");
    EXPECT_EQ(request.Process(true, 0), 0);
    EXPECT_EQ(request.GetError(), static_cast<int>(CredError::kUploadUnreadable));
    EXPECT_EQ(server->connections(), 0);
    server->answer(Answer::json(R"({"success":false,"error":{"code":102}})"));
    EXPECT_EQ(login(), 0);
    EXPECT_EQ(reply_["error"]["msg"]["cred_error"], static_cast<int>(CredError::kSealFailed));
    EXPECT_EQ(server->requests().size(), 1U);
}

} // namespace
