// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <atomic>
#include <chrono>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <utility>
#include <vector>

struct ssl_ctx_st;

namespace OvraTest {

class Stream;
class TestCertificate;

/// The server's reaction to a request: bytes, their pace, and what follows.
struct Answer {
    enum class Ending { kKeep, kClose, kReset, kHang };

    std::string bytes;
    std::chrono::milliseconds pausePerByte{0};
    Ending ending = Ending::kKeep;
    std::size_t blanks = 0; ///< sent after `bytes`; a huge answer is never held in memory

    /// A complete HTTP answer; the connection stays open.
    static Answer http(int status, const std::string &type, const std::string &body,
                       const std::string &headers = "");
    static Answer json(const std::string &document) {
        return http(200, "application/json", document);
    }
    /// {"success":true,"data":DATA}
    static Answer success(const std::string &data = "{}") {
        return json(R"({"success":true,"data":)" + data + "}");
    }
    static Answer html() { return http(200, "text/html", "<html><body>It works!</body></html>"); }
    static Answer empty() { return json(""); }
    static Answer status(int status) { return http(status, "text/plain", "no"); }
    static Answer redirect(const std::string &url) {
        return http(302, "text/plain", "", "Location: " + url + "\r\n");
    }
    /// Never answers.
    static Answer silence() { return {"", {}, Ending::kHang}; }
    /// Sends only these bytes, then closes.
    static Answer raw(const std::string &bytes) { return {bytes, {}, Ending::kClose}; }
    /// Closes without sending a byte.
    static Answer closed() { return raw(""); }
    /// Resets the connection without sending a byte.
    static Answer reset() { return {"", {}, Ending::kReset}; }
    /// Announces `document` and closes in the middle.
    static Answer truncated(const std::string &document) {
        const std::string whole = json(document).bytes;
        return raw(whole.substr(0, whole.size() - document.size() / 2));
    }
    /// A body of that many bytes.
    /// \param announced  whether the header has its length
    static Answer huge(std::size_t size, bool announced);
    /// A valid answer, one byte at a time.
    static Answer drip(std::chrono::milliseconds pause) { return {success().bytes, pause}; }
};

/// A request as it arrived.
struct Received {
    std::string method;
    std::string path;
    std::string headers; ///< as they came, lines ended by \r\n
    std::string body;
    int connection = 0; ///< counted from 1
};

/// An HTTP server on loopback with scripted behaviour, for testing clients.
///
///     MisbehavingServer server({.tls = true});
///     server.answer(Answer::html());
///     ... send to 127.0.0.1, server.port() ...
///     EXPECT_EQ(server.requests().size(), 1U);
///
/// Threads serve the connections until destruction. Every operation may be called at any time.
class MisbehavingServer {
public:
    struct Options {
        bool tls = false;
        bool oldTls = false; ///< speaks TLS 1.1 and nothing newer
        std::string address = "127.0.0.1";
        int port = 0; ///< 0: a free one
    };
    using Responder = std::function<Answer(const Received &)>;

    explicit MisbehavingServer(Options options);
    MisbehavingServer()
        : MisbehavingServer(Options()) {}
    ~MisbehavingServer();

    int port() const { return port_; }
    /// "SHA256:..." of the key of its current certificate; computed with OpenSSL alone.
    std::string fingerprint() const;

    /// The answer to every request from now on; at first it is Answer::success().
    void answer(Answer answer) {
        answerWith([answer = std::move(answer)](const Received &) { return answer; });
    }
    /// The answer to the next request only; several are used in order, before answer().
    void answerOnce(Answer answer);
    /// Computes every answer from now on.
    void answerWith(Responder responder);

    /// Adds its certificate to a folder of certificates that a system trusts.
    void addTo(const std::string &folder) const;
    /// A new key and certificate for future connections.
    void changeCertificate();
    /// From now on accepts connections and sends nothing on them, not even TLS.
    void fallSilent() { silent_ = true; }
    /// Closes every open connection.
    void closeConnections();
    /// From now on nothing that is sent on the open connections arrives or is acknowledged.
    void deafen();
    /// Closes the port: connections are refused.
    void refuse();

    std::vector<Received> requests() const;
    /// The number of accepted connections.
    int connections() const;

private:
    void acceptAll();
    void serve(Stream &stream, int fd, int number);
    Answer answerTo(const Received &request);

    const Options options_;
    int port_ = 0;
    int listener_;
    std::atomic<bool> silent_{false};

    mutable std::mutex mutex_; ///< of everything below
    std::shared_ptr<TestCertificate> certificate_;
    std::shared_ptr<ssl_ctx_st> context_;
    std::deque<Answer> queue_;
    Responder responder_ = [](const Received &) { return Answer::success(); };
    std::vector<Received> received_;
    int accepted_ = 0;
    std::set<int> open_;
    std::vector<std::thread> threads_;
    std::thread acceptor_;
};

/// A port on 127.0.0.1 where nothing listens.
int unusedPort();

} // namespace OvraTest
