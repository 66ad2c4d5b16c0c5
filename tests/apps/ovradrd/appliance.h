// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "daemon.h"

#include <gtest/gtest.h>
#include <json/json.h>

#include <memory>
#include <string>

namespace OvraTest {

/// The web server's reply.
struct Reply {
    long status = 0; ///< of HTTP; 0: no answer
    std::string text;
    Json::Value document;

    /// The error code; 0 for success, -1 if it is not a reply document.
    int code() const;
    const Json::Value &data() const { return document["data"]; }
};

/// The behaviour of an HTTP client; by default it posts a form over TLS on a new connection.
struct HttpCall {
    std::string path = "/webapi/query.cgi";
    std::string body;
    std::string method = "POST";
    std::string type = "application/x-www-form-urlencoded";
    bool tls = true;
    bool chunked = false;
    std::string from; ///< the address that connects, of 127.0.0.0/8
};

/// A client of the web server at these ports of 127.0.0.1, for one thread. It keeps its
/// connections.
class HttpClient {
public:
    HttpClient(int https, int http);
    Reply http(const HttpCall &call) const;
    /// \param sid  "": none
    Reply call(const std::string &api, int version, const std::string &method,
               const Json::Value &params = Json::Value(), const std::string &sid = "",
               bool tls = true) const;
    Reply login(const std::string &account, const std::string &password,
                const std::string &code = "", const std::string &from = "") const;

private:
    const int https_;
    const int http_;
    std::unique_ptr<void, void (*)(void *)> curl_;
};

/// A fixture with an appliance set up in the test's sandbox, and a daemon in this process that
/// serves it on 127.0.0.1 at its own ports.
class Appliance : public testing::Test {
public:
    static constexpr char kPassword[] = "correct horse";

    /// Creates what set-up creates. For tests that need no daemon.
    static void provision();
    static void addAccount(const std::string &name, bool administrator);
    /// A session without a log-in.
    static std::string session(const std::string &user, int timeout = 3600);

    int port(bool tls) const { return tls ? daemon_->httpsPort() : daemon_->httpPort(); }
    /// The calls of HttpClient, each over a new connection.
    Reply http(const HttpCall &call) const { return client().http(call); }
    Reply call(const std::string &api, int version, const std::string &method,
               const Json::Value &params = Json::Value(), const std::string &sid = "",
               bool tls = true) const {
        return client().call(api, version, method, params, sid, tls);
    }
    Reply login(const std::string &account, const std::string &password,
                const std::string &code = "") const {
        return client().login(account, password, code);
    }
    /// The answer to a process of the appliance, which calls through the Unix socket.
    static Json::Value callHere(const char *api, int version, const char *method,
                                const Json::Value &params = Json::objectValue);

protected:
    void SetUp() override;
    void TearDown() override { daemon_.reset(); }
    /// Restarts the daemon.
    void restart(const OvraService::HttpLimits &limits, std::size_t testFiles = 16);
    Ovradrd::Daemon &daemon() { return *daemon_; }

private:
    HttpClient client() const { return {port(true), port(false)}; }

    std::unique_ptr<Ovradrd::Daemon> daemon_;
};

/// A JSON object from its text.
Json::Value json(const std::string &text);

} // namespace OvraTest
