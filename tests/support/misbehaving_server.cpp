// SPDX-License-Identifier: Apache-2.0
#include "support/misbehaving_server.h"

#include "support/test_certificate.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <openssl/ssl.h>
#include <pthread.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <deque>
#include <mutex>
#include <optional>
#include <set>
#include <stdexcept>
#include <thread>
#include <utility>

namespace OvraTest {

namespace {

constexpr std::size_t kMaxRequest = std::size_t{64} * 1024 * 1024;

struct FreeContext {
    void operator()(SSL_CTX *context) const { SSL_CTX_free(context); }
};
struct FreeSsl {
    void operator()(SSL *ssl) const { SSL_free(ssl); }
};
using Context = std::shared_ptr<SSL_CTX>;

Context makeContext(const TestCertificate &certificate) {
    Context context(SSL_CTX_new(TLS_server_method()), FreeContext());
    if (!context || SSL_CTX_use_certificate(context.get(), certificate.certificate()) != 1 ||
        SSL_CTX_use_PrivateKey(context.get(), certificate.key()) != 1) {
        throw std::runtime_error("no TLS for the test server");
    }
    return context;
}

sockaddr_in loopback(const std::string &address) {
    sockaddr_in result{};
    result.sin_family = AF_INET;
    if (inet_pton(AF_INET, address.c_str(), &result.sin_addr) != 1) {
        throw std::runtime_error("not an IPv4 address: " + address);
    }
    return result;
}

int listenOn(const std::string &address, int &port) {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const int on = 1;
    setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    sockaddr_in bound = loopback(address);
    bound.sin_port = htons(static_cast<std::uint16_t>(port));
    socklen_t size = sizeof(bound);
    auto *generic = reinterpret_cast<sockaddr *>(&bound);
    if (fd < 0 || bind(fd, generic, size) != 0 || listen(fd, 64) != 0 ||
        getsockname(fd, generic, &size) != 0) {
        throw std::runtime_error("the test server cannot listen");
    }
    port = ntohs(bound.sin_port);
    return fd;
}

/// One accepted connection, plain or with TLS.
class Stream {
public:
    explicit Stream(int fd)
        : fd_(fd) {}

    bool startTls(SSL_CTX *context) {
        ssl_.reset(SSL_new(context));
        return ssl_ && SSL_set_fd(ssl_.get(), fd_) == 1 && SSL_accept(ssl_.get()) == 1;
    }
    /// Appends received bytes; false at the end.
    bool readSome(std::string &text) {
        char part[16384];
        const ssize_t got =
            ssl_ ? SSL_read(ssl_.get(), part, sizeof(part)) : recv(fd_, part, sizeof(part), 0);
        if (got <= 0) {
            return false;
        }
        text.append(part, static_cast<std::size_t>(got));
        return text.size() <= kMaxRequest;
    }
    bool writeAll(const char *data, std::size_t size) {
        while (size > 0) {
            const int chunk = static_cast<int>(std::min<std::size_t>(size, 65536));
            const ssize_t put = ssl_ ? SSL_write(ssl_.get(), data, chunk)
                                     : send(fd_, data, static_cast<std::size_t>(chunk), 0);
            if (put <= 0) {
                return false;
            }
            data += put;
            size -= static_cast<std::size_t>(put);
        }
        return true;
    }
    void end() {
        if (ssl_) {
            SSL_shutdown(ssl_.get());
        }
    }

private:
    int fd_;
    std::unique_ptr<SSL, FreeSsl> ssl_;
};

std::size_t contentLength(const std::string &headers) {
    static const std::string kName = "Content-Length: ";
    const std::size_t at = headers.find(kName);
    return at == std::string::npos ? 0
                                   : std::strtoul(headers.c_str() + at + kName.size(), nullptr, 10);
}

/// Extracts one request from `buffer`, reading more as needed.
std::optional<Received> readRequest(Stream &stream, std::string &buffer) {
    std::size_t end = 0;
    while ((end = buffer.find("\r\n\r\n")) == std::string::npos) {
        const bool isTls = buffer.starts_with('\x16'); // the first byte of a ClientHello
        if (isTls || !stream.readSome(buffer)) {
            return std::nullopt;
        }
    }
    Received request;
    const std::size_t line = buffer.find("\r\n");
    const std::string first = buffer.substr(0, line);
    const std::size_t blank = first.find(' ');
    request.method = first.substr(0, blank);
    request.path = first.substr(blank + 1, first.rfind(' ') - blank - 1);
    request.headers = buffer.substr(line + 2, end - line);
    const std::size_t length = contentLength(request.headers);
    buffer.erase(0, end + 4);
    while (buffer.size() < length) {
        if (!stream.readSome(buffer)) {
            return std::nullopt;
        }
    }
    request.body = buffer.substr(0, length);
    buffer.erase(0, length);
    return request;
}

} // namespace

Answer Answer::http(int status, const std::string &type, const std::string &body,
                    const std::string &headers) {
    return {"HTTP/1.1 " + std::to_string(status) + " Test\r\nContent-Type: " + type +
            "\r\nContent-Length: " + std::to_string(body.size()) + "\r\n" + headers + "\r\n" +
            body};
}

Answer Answer::json(const std::string &document) {
    return http(200, "application/json", document);
}

Answer Answer::success(const std::string &data) {
    return json(R"({"success":true,"data":)" + data + "}");
}

Answer Answer::html() {
    return http(200, "text/html", "<html><body>It works!</body></html>");
}

Answer Answer::empty() {
    return http(200, "application/json", "");
}

Answer Answer::status(int status) {
    return http(status, "text/plain", "no");
}

Answer Answer::redirect(const std::string &url) {
    return http(302, "text/plain", "", "Location: " + url + "\r\n");
}

Answer Answer::silence() {
    return {"", {}, Ending::kHang};
}

Answer Answer::closed() {
    return {"", {}, Ending::kClose};
}

Answer Answer::reset() {
    return {"", {}, Ending::kReset};
}

Answer Answer::truncated(const std::string &document) {
    Answer whole = json(document);
    whole.bytes.resize(whole.bytes.size() - document.size() / 2);
    whole.ending = Ending::kClose;
    return whole;
}

Answer Answer::huge(std::size_t size, bool announced) {
    Answer answer;
    answer.bytes = "HTTP/1.1 200 OK\r\nContent-Type: application/json\r\n";
    if (announced) {
        answer.bytes += "Content-Length: " + std::to_string(size) + "\r\n";
    }
    answer.bytes += "\r\n";
    answer.blanks = size;
    answer.ending = Ending::kClose;
    return answer;
}

Answer Answer::drip(std::chrono::milliseconds pausePerByte) {
    Answer whole = success();
    whole.pausePerByte = pausePerByte;
    return whole;
}

Answer Answer::raw(const std::string &bytes) {
    return {bytes, {}, Ending::kClose};
}

struct MisbehavingServer::Impl {
    explicit Impl(Options chosen)
        : options(std::move(chosen)) {
        if (options.tls) {
            newCertificate();
        }
        port = options.port;
        listener = listenOn(options.address, port);
        acceptor = std::thread([this] { acceptAll(); });
    }
    ~Impl() {
        refuse();
        closeAll();
        for (std::thread &thread : threads) {
            thread.join();
        }
    }

    void newCertificate() {
        certificate.emplace();
        context = makeContext(*certificate);
    }

    /// Stops the acceptor, then closes the port; once.
    void refuse() {
        if (acceptor.joinable()) {
            shutdown(listener, SHUT_RDWR);
            acceptor.join();
            close(listener);
        }
    }

    void closeAll() {
        const std::lock_guard<std::mutex> lock(mutex);
        for (const int fd : open) {
            shutdown(fd, SHUT_RDWR);
        }
    }

    void acceptAll() {
        for (;;) {
            const int fd = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd < 0) {
                return;
            }
            const int on = 1;
            setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof(on));
            const std::lock_guard<std::mutex> lock(mutex);
            open.insert(fd);
            const int number = ++accepted;
            threads.emplace_back([this, fd, number] { serve(fd, number); });
        }
    }

    void serve(int fd, int number) {
        // A peer that closes the connection must not end the test with SIGPIPE.
        sigset_t sigpipe;
        sigemptyset(&sigpipe);
        sigaddset(&sigpipe, SIGPIPE);
        pthread_sigmask(SIG_BLOCK, &sigpipe, nullptr);
        {
            Stream stream(fd);
            talk(stream, fd, number);
        }
        const std::lock_guard<std::mutex> lock(mutex);
        open.erase(fd);
        close(fd);
    }

    void talk(Stream &stream, int fd, int number) {
        if (silent) {
            waitForEnd(fd);
            return;
        }
        if (options.tls) {
            Context present;
            {
                const std::lock_guard<std::mutex> lock(mutex);
                present = context;
            }
            if (!stream.startTls(present.get())) {
                return;
            }
        }
        std::string buffer;
        for (;;) {
            std::optional<Received> request = readRequest(stream, buffer);
            if (!request) {
                return;
            }
            request->connection = number;
            const Answer answer = answerTo(*request);
            if (!sendAnswer(stream, answer) || answer.ending == Answer::Ending::kClose) {
                stream.end();
                return;
            }
            if (answer.ending == Answer::Ending::kReset) {
                const linger reset{1, 0};
                setsockopt(fd, SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
                return;
            }
            if (answer.ending == Answer::Ending::kHang) {
                waitForEnd(fd);
                return;
            }
        }
    }

    static bool sendBlanks(Stream &stream, std::size_t count) {
        static const std::string kBlanks(65536, ' ');
        while (count > 0) {
            const std::size_t chunk = std::min(count, kBlanks.size());
            if (!stream.writeAll(kBlanks.data(), chunk)) {
                return false;
            }
            count -= chunk;
        }
        return true;
    }

    static bool sendAnswer(Stream &stream, const Answer &answer) {
        if (answer.pausePerByte.count() == 0) {
            return stream.writeAll(answer.bytes.data(), answer.bytes.size()) &&
                   sendBlanks(stream, answer.blanks);
        }
        for (const char &byte : answer.bytes) {
            std::this_thread::sleep_for(answer.pausePerByte);
            if (!stream.writeAll(&byte, 1)) {
                return false;
            }
        }
        return true;
    }

    static void waitForEnd(int fd) {
        char byte = 0;
        while (recv(fd, &byte, 1, 0) > 0) {
        }
    }

    Answer answerTo(const Received &request) {
        std::unique_lock<std::mutex> lock(mutex);
        received.push_back(request);
        if (!queue.empty()) {
            Answer next = std::move(queue.front());
            queue.pop_front();
            return next;
        }
        const Responder chosen = responder;
        lock.unlock();
        return chosen(request);
    }

    const Options options;
    int port = 0;
    int listener = -1;
    std::atomic<bool> silent{false};
    std::thread acceptor;

    mutable std::mutex mutex; ///< of everything below
    std::optional<TestCertificate> certificate;
    Context context;
    std::deque<Answer> queue;
    Responder responder = [](const Received &) { return Answer::success(); };
    std::vector<Received> received;
    int accepted = 0;
    std::set<int> open;
    std::vector<std::thread> threads;
};

MisbehavingServer::MisbehavingServer(Options options)
    : impl_(std::make_unique<Impl>(std::move(options))) {}

MisbehavingServer::~MisbehavingServer() = default;

int MisbehavingServer::port() const {
    return impl_->port;
}

std::string MisbehavingServer::fingerprint() const {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    if (!impl_->certificate) {
        return {};
    }
    unsigned char *encoded = nullptr;
    const int size =
        i2d_X509_PUBKEY(X509_get_X509_PUBKEY(impl_->certificate->certificate()), &encoded);
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int digestSize = 0;
    EVP_Digest(encoded, static_cast<std::size_t>(size), digest, &digestSize, EVP_sha256(), nullptr);
    OPENSSL_free(encoded);
    std::string base64(64, '\0');
    const int length = EVP_EncodeBlock(reinterpret_cast<unsigned char *>(base64.data()), digest,
                                       static_cast<int>(digestSize));
    base64.resize(static_cast<std::size_t>(length));
    base64.erase(base64.find('='));
    return "SHA256:" + base64;
}

void MisbehavingServer::answer(Answer answer) {
    answerWith([answer = std::move(answer)](const Received &) { return answer; });
}

void MisbehavingServer::answerOnce(Answer answer) {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    impl_->queue.push_back(std::move(answer));
}

void MisbehavingServer::answerWith(Responder responder) {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    impl_->responder = std::move(responder);
}

void MisbehavingServer::changeCertificate() {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    impl_->newCertificate();
}

void MisbehavingServer::fallSilent() {
    impl_->silent = true;
}

void MisbehavingServer::closeConnections() {
    impl_->closeAll();
}

void MisbehavingServer::refuse() {
    impl_->refuse();
}

std::vector<Received> MisbehavingServer::requests() const {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    return impl_->received;
}

int MisbehavingServer::connections() const {
    const std::lock_guard<std::mutex> lock(impl_->mutex);
    return impl_->accepted;
}

int unusedPort() {
    int port = 0;
    close(listenOn("127.0.0.1", port));
    return port;
}

} // namespace OvraTest
