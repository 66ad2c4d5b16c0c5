// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "support/misbehaving_server.h"

#include <ovracredential/cred_request.h>
#include <ovraplatform/cred_errors.h>
#include <ovraplatform/farlink.h>
#include <ovraplatform/peer_trust.h>

#include <gtest/gtest.h>
#include <sys/mount.h>

#include <chrono>
#include <cstdlib>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace OvraPlatform;
using namespace OvraTest;
using namespace std::chrono_literals;

void trust(const MisbehavingServer &server) {
    EXPECT_EQ(trustEndpoint("https", "127.0.0.1", server.port(), server.fingerprint()),
              TrustVerdict::kTrusted);
}

/// A credential and a session.
struct Objects {
    explicit Objects(const MisbehavingServer &server, const char *host = "127.0.0.1") {
        EXPECT_EQ(OVRACredItemSetProtocol(cred.get(), "https"), 0);
        EXPECT_EQ(OVRACredItemSetHost(cred.get(), host), 0);
        EXPECT_EQ(OVRACredItemSetPort(cred.get(), server.port()), 0);
        EXPECT_EQ(OVRACredSessItemSetAccessToken(sess.get(), "sid-1"), 0);
    }
    std::unique_ptr<OVRACred, decltype(&OVRACredFree)> cred{OVRACredAlloc(), OVRACredFree};
    std::unique_ptr<OVRACredSess, decltype(&OVRACredSessFree)> sess{OVRACredSessAlloc(),
                                                                    OVRACredSessFree};
};

struct Result {
    bool ok;
    CredError error;
    std::string response;
};

Result process(OVRA::CredRequest &request, bool reuse = true, int mode = 0) {
    const bool ok = request.Process(reuse, mode) != 0;
    return {ok, static_cast<CredError>(request.GetError()), request.GetResponse()};
}

/// Calls OVRA.Test "get" on the server.
Result call(const MisbehavingServer &server, bool reuse = true, long seconds = 5,
            const char *host = "127.0.0.1") {
    const Objects objects(server, host);
    OVRA::CredRequest request;
    Json::Value params;
    params["text"] = "a&b";
    EXPECT_NE(OVRA::CredRequest::CreateWebAPIRequest(
                  request, objects.cred.get(), objects.sess.get(), "OVRA.Test", 1, "get", params),
              0);
    EXPECT_NE(request.SetResponseTimeout(seconds), 0);
    return process(request, reuse);
}

Result probe(const std::string &protocol, int port, const std::string &host = "127.0.0.1") {
    OVRA::CredRequest request;
    EXPECT_NE(request.SetURL(protocol, host, port, "webapi/query.cgi"), 0);
    EXPECT_NE(request.SetDefaultTimeout(3), 0);
    return process(request, true, 2);
}

struct CredRequestScene : OwnFiles {
    void SetUp() override {
        OwnFiles::SetUp();
        trust(server);
    }
    Result call(bool reuse = true, long seconds = 5) const {
        return ::call(server, reuse, seconds);
    }
    std::string endpoint() const { return "https://127.0.0.1:" + std::to_string(server.port()); }

    MisbehavingServer server{{.tls = true}};
};

TEST_F(CredRequestScene, PostsTheCallAndReturnsTheDocument) {
    EXPECT_EQ(call().response, R"({"success":true,"data":{}})");
    const std::vector<Received> requests = server.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_NE(requests[0].headers.find("application/x-www-form-urlencoded"), std::string::npos);
    EXPECT_EQ(requests[0].body, "api=OVRA.Test&version=1&method=get&_sid=sid-1&text=%22a%26b%22");
}

std::string manyHeaders() {
    std::string bytes = "HTTP/1.1 200 OK\r\n";
    for (int i = 0; i < 200; ++i) {
        bytes += "X: " + std::string(1000, 'x') + "\r\n";
    }
    return bytes;
}

std::string manyZeros() {
    std::string text;
    for (int i = 0; i < 4'000'000; ++i) {
        text += ",0";
    }
    return text;
}

TEST_F(CredRequestScene, TellsWhatWasWrongWithAnAnswerAndProbesForAnyOfTheEntryPoint) {
    using E = CredError;
    const std::string refusal = R"({"success":false,"error":{"code":105}})";
    const Answer noEnd = {"HTTP/1.1 200 OK\r\n\r\n{", {}, Answer::Ending::kHang};
    const struct {
        const char *name;
        Answer answer;
        CredError call;
        CredError probe;
    } scenes[] = {{"an error document", Answer::json(refusal), E::kNone, E::kNone},
                  {"HTML", Answer::html(), E::kReplyBroken, E::kNone},
                  {"an empty body", Answer::empty(), E::kReplyBroken, E::kNone},
                  {"JSON of another shape", Answer::json("[1]"), E::kReplyBroken, E::kNone},
                  {"no success flag", Answer::json(R"({"data":{}})"), E::kReplyBroken, E::kNone},
                  {"code 0", Answer::json(R"({"success":false,"error":{"code":0}})"),
                   E::kReplyBroken, E::kNone},
                  {"a cut document", Answer::truncated(refusal), E::kConnectionLost, E::kNone},
                  {"7 MiB", Answer::success(R"({"x":")" + std::string(7 << 20, 'x') + "\"}"),
                   E::kNone, E::kNone},
                  {"8 MB of numbers", Answer::success("{\"x\":[0" + manyZeros() + "]}"),
                   E::kReplyTooLarge, E::kNone},
                  {"50 MB", Answer::huge(50'000'000, false), E::kReplyTooLarge, E::kNone},
                  {"9 MiB announced", Answer::huge(9 << 20, true), E::kReplyTooLarge, E::kNone},
                  {"headers without end", Answer::raw(manyHeaders()), E::kReplyTooLarge, E::kNone},
                  {"no HTTP", Answer::raw("220 hello\r\n"), E::kReplyBroken, E::kReplyBroken},
                  {"a cut status", Answer::raw("HTTP/1.1"), E::kConnectionLost, E::kConnectionLost},
                  {"nothing, closing", Answer::closed(), E::kConnectionLost, E::kConnectionLost},
                  {"nothing, resetting", Answer::reset(), E::kConnectionLost, E::kConnectionLost},
                  {"nothing, waiting", Answer::silence(), E::kUnanswered, E::kTimedOut},
                  {"too slowly", Answer::drip(50ms), E::kUnanswered, E::kNone},
                  {"a body without end", noEnd, E::kUnanswered, E::kNone},
                  {"401", Answer::status(401), E::kNoPermission, E::kNone},
                  {"403", Answer::status(403), E::kNoPermission, E::kNone},
                  {"404", Answer::status(404), E::kHttpStatus, E::kHttpStatus},
                  {"500", Answer::status(500), E::kHttpStatus, E::kHttpStatus},
                  {"a redirect", Answer::redirect("https://127.0.0.1/"), E::kHttpStatus, E::kNone}};
    for (const auto &scene : scenes) {
        for (const std::string how : {"http", "https", "call"}) {
            MisbehavingServer peer({.tls = how != "http"});
            std::filesystem::remove_all(kStateDir);
            if (how == "call") {
                trust(peer);
            }
            peer.answer(scene.answer);
            const auto begin = std::chrono::steady_clock::now();
            const E expected = how == "call" ? scene.call : scene.probe;
            const bool slow = expected == E::kUnanswered;
            const Result result =
                how == "call" ? ::call(peer, true, slow ? 3 : 30) : probe(how, peer.port());
            EXPECT_EQ(result.error, expected) << scene.name << how;
            EXPECT_EQ(result.ok, expected == E::kNone) << scene.name << how;
            EXPECT_EQ(result.response.empty(), !result.ok || how != "call") << scene.name << how;
            EXPECT_LT(std::chrono::steady_clock::now() - begin, slow ? 20s : 40s) << scene.name;
            const std::vector<Received> requests = peer.requests();
            ASSERT_EQ(requests.size(), 1U) << scene.name << how;
            EXPECT_EQ(requests[0].method, how == "call" ? "POST" : "GET");
            EXPECT_EQ(requests[0].path, "/webapi/query.cgi");
            EXPECT_EQ(requests[0].body.empty(), how != "call");
            EXPECT_TRUE(how == "call" || TrustStore().list()->empty()) << scene.name;
        }
    }
}

TEST_F(CredRequestScene, TellsWhyItCannotConnect) {
    MisbehavingServer plain;
    server.refuse();
    EXPECT_EQ(call().error, CredError::kCannotConnect);
    EXPECT_EQ(::call(plain).error, CredError::kCannotConnect) << "no TLS on that port";
    MisbehavingServer old({.tls = true, .oldTls = true});
    EXPECT_EQ(::call(old).error, CredError::kTlsTooOld);
    EXPECT_EQ(probe("https", old.port()).error, CredError::kTlsTooOld);
    EXPECT_EQ(probe("http", unusedPort()).error, CredError::kCannotConnect);
    EXPECT_EQ(probe("http", 5000, "no-such-host.invalid").error, CredError::kCannotConnect);

    MisbehavingServer silent({.tls = true});
    silent.fallSilent();
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(::call(silent, true, 1).error, CredError::kTimedOut);
    std::filesystem::create_directories(kConfigDir);
    ASSERT_TRUE(writeFarlinkSettings({"127.0.0.1", silent.port(), ""}));
    EXPECT_EQ(probe("flk", 1, "alias").error, CredError::kTimedOut) << "while it is looked up";
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 9s);
}

TEST_F(CredRequestScene, FollowsNeitherARedirectNorAProxyOfTheEnvironment) {
    MisbehavingServer elsewhere;
    const std::string url = "http://127.0.0.1:" + std::to_string(elsewhere.port()) + "/";
    for (const char *name : {"http_proxy", "https_proxy", "all_proxy", "HTTPS_PROXY"}) {
        setenv(name, url.c_str(), 1);
    }
    EXPECT_TRUE(call().ok);
    server.answer(Answer::redirect(url));
    EXPECT_FALSE(call().ok);
    EXPECT_EQ(elsewhere.connections(), 0);
}

TEST_F(CredRequestScene, RefusesWhatCannotBeSent) {
    const Objects objects(server);
    OVRA::CredRequest request;
    EXPECT_EQ(process(request).error, CredError::kBadArgument);
    EXPECT_EQ(request.SetURL("https", "a/b", 1, "x"), 0);
    EXPECT_EQ(request.GetError(), static_cast<int>(CredError::kBadArgument));
    EXPECT_EQ(request.SetDefaultTimeout(0) + request.SetResponseTimeout(-1), 0);
    EXPECT_EQ(request.SetEncryptMode(1), 0);
    const auto create = [&](OVRACred *cred, const char *api, int version, const Json::Value &params,
                            const char *method = "get") {
        return OVRA::CredRequest::CreateWebAPIRequest(request, cred, objects.sess.get(), api,
                                                      version, method, params);
    };
    EXPECT_EQ(create(nullptr, "A", 1, {}), 0);
    EXPECT_EQ(create(objects.cred.get(), "", 1, {}), 0);
    EXPECT_EQ(create(objects.cred.get(), "A", 0, {}), 0);
    EXPECT_EQ(create(objects.cred.get(), "A", 1, "text"), 0);
    EXPECT_EQ(create(objects.cred.get(), "A", 1, {}, ""), 0);
    EXPECT_EQ(request.GetError(), static_cast<int>(CredError::kBadArgument));

    EXPECT_NE(OVRACredItemSetProtocol(objects.cred.get(), "flk"), 0);
    EXPECT_NE(OVRACredItemSetHost(objects.cred.get(), "a b"), 0);
    EXPECT_NE(OVRACredItemSetPort(objects.cred.get(), 0), 0);
    EXPECT_NE(OVRACredItemSetRemoteAccount(objects.cred.get(), ""), 0);
    EXPECT_NE(OVRACredItemSetRemotePasswd(nullptr, "x"), 0);
    EXPECT_NE(create(objects.cred.get(), "A", 1, {}), 0) << "what was refused changed nothing";
}

TEST_F(CredRequestScene, KeepsAConnectionForTheNextRequestUntilThePeerClosesIt) {
    call();
    const int before = server.connections();
    for (int i = 0; i < 5; ++i) {
        EXPECT_TRUE(call().ok);
    }
    EXPECT_EQ(server.connections(), before);
    EXPECT_TRUE(call(false).ok);
    EXPECT_EQ(server.connections(), before + 1);
    server.closeConnections();
    std::this_thread::sleep_for(50ms);
    EXPECT_TRUE(call().ok) << "one that the peer has closed is replaced";
    EXPECT_EQ(server.requests().size(), 8U);
    server.deafen();
    const std::jthread ending([this] {
        std::this_thread::sleep_for(200ms);
        server.closeConnections();
    });
    EXPECT_TRUE(call(true, 30).ok) << "repeated, as the peer had ended its stream before";
    EXPECT_EQ(server.requests().size(), 9U);
}

TEST_F(CredRequestScene, DoesNotRepeatARequestThatMayHaveBeenCarriedOut) {
    call();
    for (const Answer &answer : {Answer::closed(), Answer::reset()}) {
        call(); // on the connection that is then used again
        const std::size_t before = server.requests().size();
        server.answerOnce(answer);
        EXPECT_EQ(call().error, CredError::kConnectionLost);
        const std::vector<Received> requests = server.requests();
        ASSERT_EQ(requests.size(), before + 1);
        EXPECT_EQ(requests[before].connection, requests[before - 1].connection);
    }
}

TEST_F(CredRequestScene, TriesEveryAddressOfAHostAndFirstTheOneThatWorked) {
    writeFile(path("hosts"), "127.0.0.1 several\n127.0.0.2 several\n127.0.0.3 several\n");
    if (mount(path("hosts").c_str(), "/etc/hosts", nullptr, MS_BIND, nullptr) != 0) {
        GTEST_SKIP() << "a host with several addresses needs the right to mount";
    }
    MisbehavingServer second({.tls = true, .address = "127.0.0.2"});
    const int port = second.port();
    EXPECT_EQ(probe("https", port, "several").error, CredError::kNone);
    MisbehavingServer before({.address = "127.0.0.1", .port = port});
    MisbehavingServer after({.address = "127.0.0.3", .port = port});
    EXPECT_EQ(probe("https", port, "several").error, CredError::kNone);
    EXPECT_EQ(before.connections() + after.connections(), 0);
    umount("/etc/hosts");
}

TEST_F(CredRequestScene, SaysThatTheShortageIsItsOwn) {
    for (const char *host : {"127.0.0.1", "localhost"}) {
        OtherProcess starved([&] {
            const rlimit none{0, 0};
            setrlimit(RLIMIT_NOFILE, &none);
            return static_cast<int>(probe("https", server.port(), host).error);
        });
        EXPECT_EQ(starved.wait(), static_cast<int>(CredError::kOutOfMemory)) << host;
    }
}

TEST_F(CredRequestScene, RefusesAnEndpointWhoseKeyHasChangedAlsoOnAKeptConnection) {
    EXPECT_TRUE(call().ok);
    server.changeCertificate();
    server.closeConnections();
    EXPECT_EQ(call().error, CredError::kCertificateChanged);
    EXPECT_EQ(call(false).error, CredError::kCertificateChanged);
    EXPECT_EQ(server.requests().size(), 1U) << "nothing may be sent to it";

    EXPECT_TRUE(TrustStore().forget(endpoint()));
    EXPECT_EQ(call().error, CredError::kNotTrusted);
    trust(server);
    EXPECT_TRUE(call().ok);
    EXPECT_TRUE(call().ok) << "on a connection that is kept until trust is taken back";
    EXPECT_EQ(trustEndpoint("https", "127.0.0.1", server.port(), "SHA256:" + std::string(43, 'A')),
              TrustVerdict::kDifferent);
    EXPECT_TRUE(TrustStore().forget(endpoint()));
    EXPECT_EQ(call().error, CredError::kNotTrusted);
}

TEST_F(CredRequestScene, AsksForTheKeyOfTheAliasWhateverTheRelaySays) {
    MisbehavingServer relay({.tls = true});
    MisbehavingServer liar({.tls = true});
    EXPECT_TRUE(TrustStore().create());
    trust(relay);
    std::filesystem::create_directories(kConfigDir);
    ASSERT_TRUE(writeFarlinkSettings({"127.0.0.1", relay.port(), ""}));
    const auto reach = [&](const std::string &port) {
        relay.answer(Answer::success(R"({"port":)" + port + "}"));
        return ::call(server, false, 5, "nas.farlink.alt").error;
    };
    const std::string honest = std::to_string(server.port());
    EXPECT_EQ(reach(honest), CredError::kNotTrusted) << "nobody has trusted the alias yet";
    EXPECT_EQ(trustEndpoint("flk", "NAS", 0, server.fingerprint()), TrustVerdict::kTrusted);
    EXPECT_EQ(reach(honest), CredError::kNone);
    EXPECT_EQ(reach(std::to_string(liar.port())), CredError::kCertificateChanged);
    EXPECT_EQ(reach(honest + R"(,"host":"other.farlink.alt")"), CredError::kCannotConnect);
    // The other lie: a certificate that the system accepts for the relay's own host.
    std::filesystem::create_directory(path("certs"));
    liar.addTo(path("certs"));
    if (mount(path("certs").c_str(), "/etc/ssl/certs", nullptr, MS_BIND, nullptr) == 0) {
        const auto met = peerFingerprint("https", "127.0.0.1", liar.port(), 5);
        EXPECT_TRUE(met && met->acceptedBySystem);
        EXPECT_EQ(reach(std::to_string(liar.port())), CredError::kCertificateChanged);
        umount("/etc/ssl/certs");
    }
    EXPECT_TRUE(liar.requests().empty());
    EXPECT_EQ(reach(honest), CredError::kNone);
}

TEST_F(CredRequestScene, ShowsTheFingerprintWithoutTrustingIt) {
    EXPECT_TRUE(std::filesystem::remove(kKnownEndpointsFile) && TrustStore().create());
    const auto identity = peerFingerprint("https", "127.0.0.1", server.port(), 5);
    ASSERT_TRUE(identity);
    EXPECT_EQ(identity->fingerprint, server.fingerprint());
    EXPECT_FALSE(identity->acceptedBySystem);
    EXPECT_EQ(identity->pinned, TrustVerdict::kUnknown);
    EXPECT_TRUE(TrustStore().list()->empty());
    EXPECT_TRUE(server.requests().empty());

    trust(server);
    EXPECT_EQ(peerFingerprint("https", "127.0.0.1", server.port(), 5).value().pinned,
              TrustVerdict::kTrusted);
    EXPECT_EQ(peerFingerprint("https", "127.0.0.1", unusedPort(), 5).error(),
              CredError::kCannotConnect);
    EXPECT_EQ(trustEndpoint("https", "127.0.0.1", server.port(), "SHA256:x"),
              TrustVerdict::kUnavailable);
}

TEST_F(CredRequestScene, LeavesTheParentsConnectionAloneInAForkedChild) {
    call();
    call();
    const int before = server.connections();
    OtherProcess child([this] { return call().ok && call().ok ? 0 : 1; });
    EXPECT_EQ(child.wait(), 0);
    EXPECT_EQ(server.connections(), before + 1);
    EXPECT_TRUE(call().ok);
    EXPECT_EQ(server.connections(), before + 1) << "the parent's must still be usable";
}

TEST_F(CredRequestScene, ServesThreadsAtOnce) {
    call();
    std::vector<std::jthread> threads;
    std::atomic<int> good{0};
    for (int i = 0; i < 8; ++i) {
        threads.emplace_back([&] {
            for (int each = 0; each < 20; ++each) {
                good += call().ok ? 1 : 0;
            }
        });
    }
    threads.clear();
    EXPECT_EQ(good, 160);
    EXPECT_EQ(server.requests().size(), 161U);
}

TEST_F(CredRequestScene, SendsAFileAlong) {
    writeFile(path("file"), "the content\n");
    const Objects objects(server);
    const auto upload = [&](const std::string &file) {
        OVRA::CredRequest request;
        OVRA::CredRequest::CreateWebAPIRequest(request, objects.cred.get(), objects.sess.get(),
                                               "OVRA.Test", 1, "put", Json::Value());
        EXPECT_NE(request.SetUploadFile(file, "report"), 0);
        return process(request).error;
    };
    EXPECT_EQ(upload(path("file")), CredError::kNone);
    EXPECT_EQ(upload(path("absent")), CredError::kUploadUnreadable);
    EXPECT_EQ(upload("/dev/zero"), CredError::kUploadUnreadable);
    ASSERT_EQ(server.requests().size(), 1U);
    const Received request = server.requests()[0];
    EXPECT_NE(request.headers.find("multipart/form-data"), std::string::npos);
    for (const char *part : {"name=\"api\"\r\n\r\nOVRA.Test\r\n", "name=\"_sid\"\r\n\r\nsid-1\r\n",
                             "name=\"report\"; filename=\"report\"", "\r\n\r\nthe content\n\r\n"}) {
        EXPECT_NE(request.body.find(part), std::string::npos) << part;
    }
}

TEST_F(CredRequestScene, ProbesOverConnectionsOfTheirOwn) {
    call();
    server.changeCertificate();
    EXPECT_TRUE(probe("https", server.port()).ok) << "a probe does not judge";
    EXPECT_TRUE(probe("https", server.port()).ok);
    EXPECT_EQ(server.connections(), 3);
    server.closeConnections();
    EXPECT_EQ(call().error, CredError::kCertificateChanged) << "nor does it vouch";
}

} // namespace
