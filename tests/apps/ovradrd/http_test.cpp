// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "support/sockets.h"

#include <openssl/ssl.h>

#include <memory>

namespace {

using namespace OvraTest;

constexpr char kGetInfo[] = "api=OVRA.Core.Encryption&version=1&method=getinfo";

struct Scene {
    const char *name;
    HttpCall call;
    long status;
    int code;
};

const std::string kTwoMegabytes(2'000'000, 'x');

const Scene kScenes[] = {

    {"call", {.body = kGetInfo}, 200, 0},
    {"callOverPlainHttp", {.body = kGetInfo, .tls = false}, 200, 0},
    {"callInChunks", {.body = kGetInfo, .chunked = true}, 200, 0},
    {"typeWithCharset",
     {.body = kGetInfo, .type = "application/x-www-form-urlencoded; charset=utf-8"},
     200,
     0},
    {"probe", {.method = "GET"}, 200, 101},
    {"otherMethod", {.method = "PUT"}, 405, 101},
    {"otherPath", {.path = "/", .method = "GET"}, 404, 101},
    {"fileOnDisk", {.path = "/webapi/../../../etc/passwd", .method = "GET"}, 404, 101},
    {"entryPointWithMore", {.path = "/webapi/query.cgi/x", .body = kGetInfo}, 404, 101},
    {"upload", {.body = "--x--", .type = "multipart/form-data; boundary=x"}, 200, 101},
    {"json", {.body = "{}", .type = "application/json"}, 200, 101},
    {"emptyBody", {}, 200, 101},
    {"noForm", {.body = "%%%"}, 200, 101},
    {"tooLarge", {.body = kTwoMegabytes}, 200, 108},
    {"tooLargeInChunks", {.body = kTwoMegabytes, .chunked = true}, 200, 108},
    {"longName", {.body = "api=" + std::string(200, 'a') + "&version=1&method=m"}, 200, 101}};

class Wire : public Appliance {};

TEST_F(Wire, AnswersEverythingWithADocument) {
    for (const Scene &scene : kScenes) {
        const Reply reply = http(scene.call);
        EXPECT_EQ(reply.status, scene.status) << scene.name;
        EXPECT_EQ(reply.code(), scene.code) << scene.name << reply.text;
    }
}

TEST_F(Wire, SurvivesRubbish) {
    std::string rubbish;
    for (int i = 0; i < 100'000; ++i) {
        rubbish += static_cast<char>(i * 7919 % 256);
    }
    const std::string get = "GET / HTTP/";
    const std::string post = "POST /webapi/query.cgi HTTP/1.1\r\nHost: a\r\n";
    for (const bool tls : {true, false}) {
        for (const std::string &bytes :
             {rubbish, std::string(100'000, '\0'), get + "9.9\r\n\r\n",
              get + "1.1\r\nX: " + std::string(100'000, 'a'), post + "Content-Length: -5\r\n\r\n",
              post + "Content-Type: application/x-www-form-urlencoded\r\n"
                     "Transfer-Encoding: chunked\r\n\r\nzz\r\n"}) {
            const auto connection = dial(port(tls));
            say(connection, bytes);
            EXPECT_NE(hearAll(connection), "timeout") << bytes.substr(0, 60);
        }
    }
    EXPECT_EQ(http({.body = kGetInfo}).code(), 0);
}

TEST_F(Wire, KeepsAConnectionForFurtherRequests) {
    const auto connection = dial(port(false));
    const std::string request = "GET /webapi/query.cgi HTTP/1.1\r\nHost: a\r\n";
    say(connection, request + "\r\n" + request + "Connection: close\r\n\r\n");
    const std::string replies = hearAll(connection);
    EXPECT_NE(replies.find("HTTP/1.1 200"), replies.rfind("HTTP/1.1 200")) << replies;
}

/// The session of a visit over TLS of exactly this version; null without a connection.
std::shared_ptr<SSL_SESSION> visit(int port, int version, SSL_SESSION *offered = nullptr) {
    const std::shared_ptr<SSL_CTX> context(SSL_CTX_new(TLS_client_method()), SSL_CTX_free);
    SSL_CTX_set_security_level(context.get(), 0);
    SSL_CTX_set_min_proto_version(context.get(), version);
    SSL_CTX_set_max_proto_version(context.get(), version);
    const std::shared_ptr<SSL> ssl(SSL_new(context.get()), SSL_free);
    const auto connection = dial(port);
    SSL_set_fd(ssl.get(), connection.get());
    if (offered != nullptr) {
        SSL_set_session(ssl.get(), offered);
    }
    if (SSL_connect(ssl.get()) != 1) {
        return nullptr;
    }
    EXPECT_EQ(SSL_session_reused(ssl.get()) == 1, offered != nullptr) << version;
    constexpr char kRequest[] = "GET /webapi/query.cgi HTTP/1.1\r\nHost: a\r\n\r\n";
    char reply[512];
    SSL_write(ssl.get(), kRequest, sizeof(kRequest) - 1);
    SSL_read(ssl.get(), reply, sizeof(reply)); // TLS 1.3 has sent its ticket before
    SSL_shutdown(ssl.get());
    return {SSL_get1_session(ssl.get()), SSL_SESSION_free};
}

TEST_F(Wire, ResumesTlsSessionsAndSpeaksNoOldTls) {
    for (const int version : {TLS1_2_VERSION, TLS1_3_VERSION}) {
        const auto session = visit(port(true), version);
        ASSERT_TRUE(session);
        EXPECT_TRUE(visit(port(true), version, session.get()));
    }
    EXPECT_FALSE(visit(port(true), TLS1_1_VERSION));
}

} // namespace
