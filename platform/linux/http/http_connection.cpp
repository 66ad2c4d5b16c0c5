// SPDX-License-Identifier: Apache-2.0
#include "http/http_connection.h"

#include "http/connection_pool.h"
#include "http/dialer.h"
#include "http/sigpipe_guard.h"

#include <ovrabase/address.h>
#include <ovradrcore/log.h>
#include <ovradrcore/no_fork.h>

#include <linux/tcp.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstddef>
#include <exception>

namespace OvraPlatform {

namespace {

/// The hashed folder and not the bundle of all certificates, which takes 26 ms to load for every
/// connection.
constexpr char kCertificateDir[] = "/etc/ssl/certs";
constexpr std::chrono::seconds kConnectTime{10};
/// A peer whose kernel is silent for this long is gone, however long the answer may take.
constexpr unsigned kSilenceMillis = 10'000;
constexpr int kKeepAliveSeconds = 3;
constexpr std::size_t kMaxHeader = std::size_t{64} * 1024;
constexpr int kMaxAttempts = 2;

bool curlReady() {
    static const bool ready = curl_global_init(CURL_GLOBAL_DEFAULT) == CURLE_OK;
    return ready;
}

/// Where a TLS context keeps its connection.
int tlsContextIndex() {
    static const int index = SSL_CTX_get_ex_new_index(0, nullptr, nullptr, nullptr, nullptr);
    return index;
}

/// Sets one option after the other and remembers whether all were taken.
class Options {
public:
    explicit Options(CURL *handle)
        : handle_(handle) {}

    template <typename Value>
    Options &set(CURLoption option, Value value) {
        ok_ = ok_ && curl_easy_setopt(handle_, option, value) == CURLE_OK;
        return *this;
    }
    bool ok() const { return ok_; }

private:
    CURL *handle_;
    bool ok_ = true;
};

struct FreeMime {
    void operator()(curl_mime *mime) const { curl_mime_free(mime); }
};
using Mime = std::unique_ptr<curl_mime, FreeMime>;

/// States of a connection (tcp(7)), of a header that excludes linux/tcp.h.
constexpr unsigned kClosed = 7;
constexpr unsigned kCloseWait = 8;

/// What the kernel says of a connection, bytes acknowledged by the peer included (RFC 4898);
/// std::nullopt if it does not tell.
std::optional<tcp_info> tcpInfo(int socket) {
    tcp_info info{};
    socklen_t size = sizeof info;
    constexpr std::size_t kNeeded =
        offsetof(tcp_info, tcpi_bytes_acked) + sizeof info.tcpi_bytes_acked;
    if (getsockopt(socket, IPPROTO_TCP, TCP_INFO, &info, &size) != 0 || size < kNeeded) {
        return std::nullopt;
    }
    return info;
}

std::optional<std::uint64_t> deliveredBytes(int socket) {
    const std::optional<tcp_info> info = tcpInfo(socket);
    return info ? std::optional<std::uint64_t>(info->tcpi_bytes_acked) : std::nullopt;
}

/// Makes the kernel end the connection if the peer's kernel neither acknowledges what is sent nor
/// answers keep-alive probes (tcp(7), RFC 5482).
void endWhenSilent(int socket) {
    const auto set = [socket](int level, int option, int value) {
        setsockopt(socket, level, option, &value, sizeof value);
    };
    set(IPPROTO_TCP, TCP_USER_TIMEOUT, static_cast<int>(kSilenceMillis));
    set(IPPROTO_TCP, TCP_KEEPIDLE, kKeepAliveSeconds);
    set(IPPROTO_TCP, TCP_KEEPINTVL, kKeepAliveSeconds);
    set(SOL_SOCKET, SO_KEEPALIVE, 1);
}

/// Whether the connection ended because the peer fell silent; the kernel's clocks are a little
/// apart.
bool hasEndedInSilence(const tcp_info &info) {
    constexpr unsigned kTolerance = 500; // milliseconds
    return info.tcpi_state == kClosed && info.tcpi_last_ack_recv + kTolerance >= kSilenceMillis;
}

/// Whether the peer ended its stream before anything beyond `before` reached it: its last segment
/// acknowledges all that its kernel had then. A reset acknowledges nothing.
bool hasEndedUnread(const tcp_info &info, std::optional<std::uint64_t> before) {
    return info.tcpi_state == kCloseWait && before == info.tcpi_bytes_acked;
}

long millisecondsUntil(Deadline deadline) {
    using std::chrono::milliseconds;
    return std::chrono::ceil<milliseconds>(deadline - std::chrono::steady_clock::now()).count();
}

/// Adds a line to a list. \return whether there was memory
template <typename List>
bool append(List &list, const std::string &line) {
    curl_slist *longer = curl_slist_append(list.get(), line.c_str());
    if (longer == nullptr) {
        return false;
    }
    static_cast<void>(list.release()); // it is part of the longer list
    list.reset(longer);
    return true;
}

bool isRegularFile(const std::string &path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

/// The form of an upload; null if there is no memory or the file cannot be read.
Mime makeForm(CURL *handle, const std::vector<std::pair<std::string, std::string>> &fields,
              const Upload &upload) {
    Mime form(curl_mime_init(handle));
    if (!form) {
        return nullptr;
    }
    for (const auto &[name, value] : fields) {
        curl_mimepart *part = curl_mime_addpart(form.get());
        if (part == nullptr || curl_mime_name(part, name.c_str()) != CURLE_OK ||
            curl_mime_data(part, value.data(), value.size()) != CURLE_OK) {
            return nullptr;
        }
    }
    curl_mimepart *file = curl_mime_addpart(form.get());
    const bool attached = file != nullptr &&
                          curl_mime_name(file, upload.name.c_str()) == CURLE_OK &&
                          curl_mime_filedata(file, upload.path.c_str()) == CURLE_OK &&
                          curl_mime_filename(file, upload.name.c_str()) == CURLE_OK &&
                          curl_mime_type(file, "application/octet-stream") == CURLE_OK;
    return attached ? std::move(form) : nullptr;
}

} // namespace

std::unique_ptr<HttpConnection> HttpConnection::open(const Endpoint &endpoint, Purpose purpose) {
    const OvraDRCore::NoFork noFork;
    if (!curlReady()) {
        return nullptr;
    }
    std::unique_ptr<HttpConnection> connection(new HttpConnection(endpoint, purpose));
    return connection->setUp() ? std::move(connection) : nullptr;
}

HttpConnection::HttpConnection(const Endpoint &endpoint, Purpose purpose)
    : endpoint_(endpoint)
    , purpose_(purpose)
    , verifier_(endpoint, purpose == Purpose::kObserve ? CertificateVerifier::Mode::kObserve
                          : purpose == Purpose::kFirstContact
                              ? CertificateVerifier::Mode::kFirstContact
                              : CertificateVerifier::Mode::kVerify)
    , handle_(curl_easy_init()) {}

HttpConnection::~HttpConnection() {
    const SigpipeGuard noSigpipe; // TLS says good-bye to a peer that may be gone
    const OvraDRCore::NoFork noFork;
    handle_.reset();
    transfer_.close();
}

bool HttpConnection::setUp() {
    if (!handle_) {
        return false;
    }
    const std::string &host = endpoint_.host();
    // dial() finds the address; this one only keeps libcurl from asking for it as well (RFC 5737).
    const bool listed =
        append(headers_, "Accept: application/json") && append(headers_, "Expect:") &&
        (endpoint_.isIpv6() || OvraBase::isNumericAddress(host) ||
         append(addresses_, OvraBase::joinHostPort(host, endpoint_.port()) + ":192.0.2.1"));
    if (!listed) {
        return false;
    }
    Options options(handle_.get());
    options.set(CURLOPT_NOSIGNAL, 1L)
        .set(CURLOPT_PROTOCOLS_STR, endpoint_.isTls() ? "https" : "http")
        .set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1))
        .set(CURLOPT_FOLLOWLOCATION, 0L)
        .set(CURLOPT_PROXY, "")
        .set(CURLOPT_NOPROXY, "*")
        .set(CURLOPT_NETRC, static_cast<long>(CURL_NETRC_IGNORED))
        .set(CURLOPT_HTTPHEADER, headers_.get())
        .set(CURLOPT_MAXCONNECTS, 1L)
        .set(CURLOPT_MAXAGE_CONN, static_cast<long>(ConnectionPool::kIdleTime.count()))
        .set(CURLOPT_RESOLVE, addresses_.get())
        .set(CURLOPT_WRITEFUNCTION, &HttpConnection::onBody)
        .set(CURLOPT_WRITEDATA, this)
        .set(CURLOPT_HEADERFUNCTION, &HttpConnection::onHeader)
        .set(CURLOPT_HEADERDATA, this)
        .set(CURLOPT_OPENSOCKETFUNCTION, &HttpConnection::onOpenSocket)
        .set(CURLOPT_OPENSOCKETDATA, this)
        .set(CURLOPT_SOCKOPTFUNCTION, &HttpConnection::onSocketOptions)
        .set(CURLOPT_CLOSESOCKETFUNCTION, &HttpConnection::onCloseSocket)
        .set(CURLOPT_CLOSESOCKETDATA, this)
        .set(CURLOPT_PREREQFUNCTION, &HttpConnection::onRequest)
        .set(CURLOPT_PREREQDATA, this);
    if (endpoint_.isTls()) {
        options.set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2))
            .set(CURLOPT_CAINFO, nullptr)
            .set(CURLOPT_CAPATH, kCertificateDir);
    }
    if (purpose_ == Purpose::kProbe) {
        options.set(CURLOPT_SSL_VERIFYPEER, 0L)
            .set(CURLOPT_SSL_VERIFYHOST, 0L)
            .set(CURLOPT_SSL_SESSIONID_CACHE, 0L)
            .set(CURLOPT_FORBID_REUSE, 1L);
    } else {
        // The verifier replaces libcurl's check of the chain, and checks the host as well.
        options.set(CURLOPT_SSL_VERIFYPEER, 1L).set(CURLOPT_SSL_VERIFYHOST, 0L);
    }
    return options.set(CURLOPT_SSL_CTX_FUNCTION, &HttpConnection::onTlsContext)
        .set(CURLOPT_SSL_CTX_DATA, this)
        .ok();
}

CredExpected<long> HttpConnection::status(const std::string &url, Deadline deadline) {
    const bool set = Options(handle_.get())
                         .set(CURLOPT_NOBODY, 1L) // a GET whose body is not waited for
                         .set(CURLOPT_CUSTOMREQUEST, "GET")
                         .ok();
    if (!set) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    const CredExpected<HttpAnswer> answer = perform(url, deadline);
    long status = 0;
    curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &status);
    constexpr long kFirstFinal = 200; // those before only announce an answer
    return status >= kFirstFinal ? status
                                 : answer.map([](const HttpAnswer &got) { return got.status; });
}

CredExpected<HttpAnswer> HttpConnection::post(const std::string &url, const std::string &body,
                                              Deadline deadline) {
    const bool set = Options(handle_.get())
                         .set(CURLOPT_POSTFIELDS, body.c_str())
                         .set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()))
                         .ok();
    CredExpected<HttpAnswer> answer = tl::unexpected(CredError::kOutOfMemory);
    if (set) {
        answer = perform(url, deadline);
    }
    curl_easy_setopt(handle_.get(), CURLOPT_POSTFIELDS, nullptr);
    return answer;
}

CredExpected<HttpAnswer>
HttpConnection::postFile(const std::string &url,
                         const std::vector<std::pair<std::string, std::string>> &fields,
                         const Upload &upload, Deadline deadline) {
    if (!isRegularFile(upload.path)) {
        return tl::unexpected(CredError::kUploadUnreadable);
    }
    const Mime form = makeForm(handle_.get(), fields, upload);
    if (!form) {
        return tl::unexpected(CredError::kUploadUnreadable);
    }
    const bool set = Options(handle_.get()).set(CURLOPT_MIMEPOST, form.get()).ok();
    CredExpected<HttpAnswer> answer = tl::unexpected(CredError::kOutOfMemory);
    if (set) {
        answer = perform(url, deadline);
    }
    curl_easy_setopt(handle_.get(), CURLOPT_MIMEPOST, nullptr);
    return answer;
}

CredExpected<void> HttpConnection::connectOnly(const std::string &url, Deadline deadline) {
    if (!Options(handle_.get()).set(CURLOPT_CONNECT_ONLY, 1L).ok()) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    return perform(url, deadline).map([](const HttpAnswer &) {});
}

CredExpected<HttpAnswer> HttpConnection::perform(const std::string &url, Deadline deadline) {
    const long left = millisecondsUntil(deadline);
    if (left <= 0) {
        return tl::unexpected(CredError::kTimedOut);
    }
    connectDeadline_ = std::min(deadline, std::chrono::steady_clock::now() + kConnectTime);
    const bool set =
        Options(handle_.get())
            .set(CURLOPT_URL, url.c_str())
            .set(CURLOPT_TIMEOUT_MS, left)
            .set(CURLOPT_CONNECTTIMEOUT_MS, std::max(millisecondsUntil(connectDeadline_), 1L))
            .set(CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(kMaxReply))
            .ok();
    if (!set) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    answer_ = HttpAnswer();
    headerBytes_ = 0;
    attempt_ = Attempt();
    notConnected_.reset();
    replyTooLarge_ = false;
    tlsTooOld_ = false;
    const SigpipeGuard noSigpipe;
    const CURLcode code = transfer_.perform(handle_.get());
    if (code != CURLE_OK) {
        OVRA_INFO("Request to [%s] failed: [%s]", endpoint_.key().c_str(),
                  curl_easy_strerror(code));
        return tl::unexpected(errorOf(code));
    }
    curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &answer_.status);
    return std::move(answer_);
}

CredError HttpConnection::errorOf(CURLcode code) const {
    if (const CredError distrusted = verifier_.error(); distrusted != CredError::kNone) {
        return distrusted;
    }
    if (attempt_.endedInSilence || code == CURLE_OPERATION_TIMEDOUT) {
        return attempt_.mayHaveArrived ? CredError::kUnanswered : CredError::kTimedOut;
    }
    if (attempt_.mayHaveArrived && code == CURLE_COULDNT_CONNECT) {
        return CredError::kConnectionLost; // connect() would not send it twice
    }
    return notConnected_ ? *notConnected_ : errorOfTransfer(code);
}

CredError HttpConnection::errorOfTransfer(CURLcode code) const {
    switch (code) {
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_CONNECT:
    case CURLE_SSL_CONNECT_ERROR:
        return tlsTooOld_ ? CredError::kTlsTooOld : CredError::kCannotConnect;
    case CURLE_PEER_FAILED_VERIFICATION:
        return CredError::kCannotConnect;
    case CURLE_FILESIZE_EXCEEDED:
        return CredError::kReplyTooLarge;
    case CURLE_WRITE_ERROR:
        return replyTooLarge_ ? CredError::kReplyTooLarge : CredError::kOutOfMemory;
    case CURLE_OUT_OF_MEMORY:
        return CredError::kOutOfMemory;
    case CURLE_READ_ERROR:
        return CredError::kUploadUnreadable;
    case CURLE_GOT_NOTHING:
    case CURLE_PARTIAL_FILE:
    case CURLE_RECV_ERROR:
    case CURLE_SEND_ERROR:
    case CURLE_ABORTED_BY_CALLBACK: // onRequest() would not send it twice
        return CredError::kConnectionLost;
    case CURLE_UNSUPPORTED_PROTOCOL: // a reply without a status line
    case CURLE_WEIRD_SERVER_REPLY:
    case CURLE_BAD_CONTENT_ENCODING:
        return CredError::kReplyBroken;
    default:
        OVRA_ERR("Unexpected failure of a request: [%s]", curl_easy_strerror(code));
        return CredError::kInternal;
    }
}

std::size_t HttpConnection::onBody(char *data, std::size_t size, std::size_t count, void *self) {
    auto *connection = static_cast<HttpConnection *>(self);
    if (connection->answer_.body.size() + size * count > kMaxReply) {
        connection->replyTooLarge_ = true;
        return 0;
    }
    try {
        connection->answer_.body.append(data, size * count);
    } catch (const std::exception &) {
        return 0;
    }
    return size * count;
}

std::size_t HttpConnection::onHeader(char *, std::size_t size, std::size_t count, void *self) {
    auto *connection = static_cast<HttpConnection *>(self);
    connection->headerBytes_ += size * count;
    connection->replyTooLarge_ = connection->headerBytes_ > kMaxHeader;
    return connection->replyTooLarge_ ? 0 : size * count;
}

CURLcode HttpConnection::onTlsContext(CURL *, void *context, void *self) {
    auto *tls = static_cast<SSL_CTX *>(context);
    auto *connection = static_cast<HttpConnection *>(self);
    if (connection->purpose_ != Purpose::kProbe) {
        connection->verifier_.install(tls);
    }
    SSL_CTX_set_ex_data(tls, tlsContextIndex(), self);
    SSL_CTX_set_info_callback(tls, &HttpConnection::onTlsEvent);
    return CURLE_OK;
}

/// Whichever end refuses the other's version says so by the same alert (RFC 8446, 6.2).
void HttpConnection::onTlsEvent(const SSL *tls, int event, int value) {
    if ((event & SSL_CB_ALERT) != 0 && (value & 0xFF) == SSL_AD_PROTOCOL_VERSION) {
        static_cast<HttpConnection *>(SSL_CTX_get_ex_data(SSL_get_SSL_CTX(tls), tlsContextIndex()))
            ->tlsTooOld_ = true;
    }
}

/// Called when a connection is ready (TLS included) and before anything of the request is sent.
///
/// libcurl repeats a request by itself if a kept connection ends without an answer, even if the
/// peer may have carried it out. Here it is repeated only if the peer had ended its stream before
/// any of the request reached it; after a reset nobody knows.
int HttpConnection::onRequest(void *self, char *, char *, int, int) {
    auto *connection = static_cast<HttpConnection *>(self);
    Attempt &attempt = connection->attempt_;
    ++attempt.count;
    if (attempt.count > kMaxAttempts || attempt.mayHaveArrived) {
        return CURL_PREREQFUNC_ABORT;
    }
    if (connection->isForRequests() && !connection->verifier_.settle()) {
        return CURL_PREREQFUNC_ABORT;
    }
    attempt.mayHaveArrived = connection->isForRequests();
    attempt.socket = connection->socket_;
    attempt.delivered = deliveredBytes(attempt.socket);
    if (!connection->endsWhenSilent_) {
        endWhenSilent(attempt.socket);
        connection->endsWhenSilent_ = true;
    }
    return CURL_PREREQFUNC_OK;
}

curl_socket_t HttpConnection::connect() {
    if (attempt_.mayHaveArrived || attempt_.endedInSilence) {
        return CURL_SOCKET_BAD;
    }
    CredExpected<OvraBase::UniqueFd> dialed = [this] {
        const OvraDRCore::NoFork::Pause forksPass; // it waits for name servers and the peer
        return dial(endpoint_, connectDeadline_);
    }();
    if (!dialed) {
        notConnected_ = dialed.error();
        return CURL_SOCKET_BAD;
    }
    socket_ = ConnectionPool::instance().adopt(std::move(*dialed));
    endsWhenSilent_ = false;
    return socket_;
}

/// The address that libcurl gives is not one; see setUp().
curl_socket_t HttpConnection::onOpenSocket(void *self, curlsocktype, curl_sockaddr *) {
    auto *connection = static_cast<HttpConnection *>(self);
    try {
        return connection->connect();
    } catch (const std::exception &) {
        connection->notConnected_ = CredError::kOutOfMemory;
        return CURL_SOCKET_BAD;
    }
}

int HttpConnection::onSocketOptions(void *, curl_socket_t, curlsocktype) {
    return CURL_SOCKOPT_ALREADY_CONNECTED;
}

int HttpConnection::onCloseSocket(void *self, curl_socket_t socket) {
    auto *connection = static_cast<HttpConnection *>(self);
    Attempt &attempt = connection->attempt_;
    if (socket == attempt.socket) {
        const std::optional<tcp_info> info = tcpInfo(socket);
        if (info && hasEndedUnread(*info, attempt.delivered)) {
            attempt.mayHaveArrived = false;
        }
        attempt.endedInSilence = info && hasEndedInSilence(*info);
        attempt.socket = -1;
    }
    connection->socket_ = -1;
    ConnectionPool::instance().closeSocket(socket);
    return 0;
}

} // namespace OvraPlatform
