// SPDX-License-Identifier: Apache-2.0
#include "support/misbehaving_server.h"

#include "support/test_certificate.h"

#include <arpa/inet.h>
#include <linux/filter.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <openssl/pem.h>
#include <openssl/ssl.h>
#include <pthread.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <optional>
#include <stdexcept>
#include <thread>
#include <utility>

namespace OvraTest {

namespace {

constexpr std::size_t kMaxRequest = std::size_t{64} * 1024 * 1024;

int listenOn(const std::string &address, int &port) {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const int on = 1;
    setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    sockaddr_in bound{};
    bound.sin_family = AF_INET;
    bound.sin_port = htons(static_cast<std::uint16_t>(port));
    socklen_t size = sizeof(bound);
    auto *generic = reinterpret_cast<sockaddr *>(&bound);
    if (fd < 0 || inet_pton(AF_INET, address.c_str(), &bound.sin_addr) != 1 ||
        bind(fd, generic, size) != 0 || listen(fd, 64) != 0 ||
        getsockname(fd, generic, &size) != 0) {
        throw std::runtime_error("the test server cannot listen");
    }
    port = ntohs(bound.sin_port);
    return fd;
}

} // namespace

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
    std::unique_ptr<SSL, decltype(&SSL_free)> ssl_{nullptr, SSL_free};
};

namespace {

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
    static const std::string kLength = "Content-Length: ";
    const std::size_t at = request.headers.find(kLength);
    const std::size_t length =
        at == std::string::npos
            ? 0
            : std::strtoul(request.headers.c_str() + at + kLength.size(), nullptr, 10);
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

bool sendAnswer(Stream &stream, const Answer &answer) {
    const bool slow = answer.pausePerByte.count() > 0;
    for (std::size_t at = 0; at < answer.bytes.size();) {
        std::this_thread::sleep_for(answer.pausePerByte);
        const std::size_t size = slow ? 1 : answer.bytes.size();
        if (!stream.writeAll(&answer.bytes[at], size)) {
            return false;
        }
        at += size;
    }
    static const std::string kBlanks(65536, ' ');
    for (std::size_t left = answer.blanks; left > 0;) {
        const std::size_t size = std::min(left, kBlanks.size());
        if (!stream.writeAll(kBlanks.data(), size)) {
            return false;
        }
        left -= size;
    }
    return true;
}

void waitForEnd(int fd) {
    char byte = 0;
    while (recv(fd, &byte, 1, 0) > 0) {
    }
}

} // namespace

Answer Answer::http(int status, const std::string &type, const std::string &body,
                    const std::string &headers) {
    return {"HTTP/1.1 " + std::to_string(status) + " Test\r\nContent-Type: " + type +
            "\r\nContent-Length: " + std::to_string(body.size()) + "\r\n" + headers + "\r\n" +
            body};
}

Answer Answer::huge(std::size_t size, bool announced) {
    const std::string length = "Content-Length: " + std::to_string(size) + "\r\n";
    return {"HTTP/1.1 200 OK\r\nContent-Type: application/json\r\n" + (announced ? length : "") +
                "\r\n",
            {},
            Ending::kClose,
            size};
}

MisbehavingServer::MisbehavingServer(Options options)
    : options_(std::move(options))
    , port_(options_.port)
    , listener_(listenOn(options_.address, port_)) {
    if (options_.tls) {
        changeCertificate();
    }
    acceptor_ = std::thread([this] { acceptAll(); });
}

MisbehavingServer::~MisbehavingServer() {
    refuse();
    closeConnections();
    for (std::thread &thread : threads_) {
        thread.join();
    }
}

void MisbehavingServer::acceptAll() {
    // A peer that closes the connection must not end the test with SIGPIPE; inherited.
    sigset_t sigpipe;
    sigemptyset(&sigpipe);
    sigaddset(&sigpipe, SIGPIPE);
    pthread_sigmask(SIG_BLOCK, &sigpipe, nullptr);
    for (int fd = 0; (fd = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC)) >= 0;) {
        const int on = 1;
        setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof(on));
        const std::lock_guard lock(mutex_);
        open_.insert(fd);
        threads_.emplace_back([this, fd, number = ++accepted_] {
            {
                Stream stream(fd);
                serve(stream, fd, number);
            }
            const std::lock_guard inThread(mutex_);
            open_.erase(fd);
            close(fd);
        });
    }
}

void MisbehavingServer::serve(Stream &stream, int fd, int number) {
    if (silent_) {
        return waitForEnd(fd);
    }
    std::unique_lock lock(mutex_);
    const auto context = context_;
    lock.unlock();
    if (options_.tls && !stream.startTls(context.get())) {
        return;
    }
    std::string buffer;
    while (std::optional<Received> request = readRequest(stream, buffer)) {
        request->connection = number;
        const Answer answer = answerTo(*request);
        if (!sendAnswer(stream, answer) || answer.ending == Answer::Ending::kClose) {
            return stream.end();
        }
        if (answer.ending == Answer::Ending::kReset) {
            const linger reset{1, 0};
            setsockopt(fd, SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
            return;
        }
        if (answer.ending == Answer::Ending::kHang) {
            return waitForEnd(fd);
        }
    }
}

Answer MisbehavingServer::answerTo(const Received &request) {
    std::unique_lock lock(mutex_);
    received_.push_back(request);
    if (!queue_.empty()) {
        Answer next = std::move(queue_.front());
        queue_.pop_front();
        return next;
    }
    const Responder chosen = responder_;
    lock.unlock();
    return chosen(request);
}

std::string MisbehavingServer::fingerprint() const {
    const std::lock_guard lock(mutex_);
    if (!certificate_) {
        return {};
    }
    unsigned char *encoded = nullptr;
    const int size = i2d_X509_PUBKEY(X509_get_X509_PUBKEY(certificate_->certificate()), &encoded);
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int digestSize = 0;
    EVP_Digest(encoded, static_cast<std::size_t>(size), digest, &digestSize, EVP_sha256(), nullptr);
    OPENSSL_free(encoded);
    unsigned char base64[65];
    EVP_EncodeBlock(base64, digest, static_cast<int>(digestSize));
    const std::string text = reinterpret_cast<const char *>(base64);
    return "SHA256:" + text.substr(0, text.find('='));
}

void MisbehavingServer::addTo(const std::string &folder) const {
    const std::lock_guard lock(mutex_);
    X509 *certificate = certificate_->certificate();
    char name[16];
    std::snprintf(name, sizeof name, "/%08lx.0", X509_subject_name_hash(certificate));
    const std::unique_ptr<FILE, int (*)(FILE *)> file(std::fopen((folder + name).c_str(), "w"),
                                                      std::fclose);
    if (!file || PEM_write_X509(file.get(), certificate) != 1) {
        throw std::runtime_error("no certificate for the system");
    }
}

void MisbehavingServer::answerOnce(Answer answer) {
    const std::lock_guard lock(mutex_);
    queue_.push_back(std::move(answer));
}

void MisbehavingServer::answerWith(Responder responder) {
    const std::lock_guard lock(mutex_);
    responder_ = std::move(responder);
}

void MisbehavingServer::changeCertificate() {
    const std::lock_guard lock(mutex_);
    certificate_ = std::make_shared<TestCertificate>();
    context_.reset(SSL_CTX_new(TLS_server_method()), SSL_CTX_free);
    if (!context_ || SSL_CTX_use_certificate(context_.get(), certificate_->certificate()) != 1 ||
        SSL_CTX_use_PrivateKey(context_.get(), certificate_->key()) != 1) {
        throw std::runtime_error("no TLS for the test server");
    }
    if (options_.oldTls) {
        SSL_CTX_set_security_level(context_.get(), 0); // allows what is broken
        SSL_CTX_set_min_proto_version(context_.get(), 0);
        SSL_CTX_set_max_proto_version(context_.get(), TLS1_1_VERSION);
    }
}

void MisbehavingServer::closeConnections() {
    const std::lock_guard lock(mutex_);
    for (const int fd : open_) {
        shutdown(fd, SHUT_RDWR);
    }
}

void MisbehavingServer::deafen() {
    const std::lock_guard lock(mutex_);
    sock_filter nothing{BPF_RET | BPF_K, 0, 0, 0};
    const sock_fprog filter{1, &nothing};
    for (const int fd : open_) {
        setsockopt(fd, SOL_SOCKET, SO_ATTACH_FILTER, &filter, sizeof filter);
    }
}

void MisbehavingServer::refuse() {
    if (acceptor_.joinable()) {
        shutdown(listener_, SHUT_RDWR);
        acceptor_.join();
        close(listener_);
    }
}

std::vector<Received> MisbehavingServer::requests() const {
    const std::lock_guard lock(mutex_);
    return received_;
}

int MisbehavingServer::connections() const {
    const std::lock_guard lock(mutex_);
    return accepted_;
}

int unusedPort() {
    int port = 0;
    close(listenOn("127.0.0.1", port));
    return port;
}

} // namespace OvraTest
