// SPDX-License-Identifier: Apache-2.0
#include "service/http_server.h"

#include "service/byte_range.h"
#include "service/rate_limit.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>
#include <ovrabase/secret.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovraplatform/api_errors.h>

#include <gnutls/gnutls.h>
#include <microhttpd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <condition_variable>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <exception>
#include <mutex>
#include <optional>
#include <string_view>
#include <unordered_map>
#include <utility>

namespace OvraService {

namespace {

namespace APIError = OvraPlatform::APIError;
using Phase = Connections::Phase;

constexpr std::string_view kEntryPoint = "/webapi/query.cgi";
constexpr std::string_view kFormType = "application/x-www-form-urlencoded";

constexpr unsigned int kThreadsPerListener = 2;
/// Of one connection, for header and buffers: what does not fit is refused.
constexpr std::size_t kConnectionMemory = std::size_t{32} * 1024;
/// Seconds; closes idle connections in good order. An active connection is bounded by the deadlines
/// instead.
constexpr unsigned int kInactivity = 40;
constexpr std::chrono::milliseconds kFlushTime{500};
/// A body up to this size is taken in and thrown away before it is refused: a client that is still
/// sending when the connection ends would not see the answer.
constexpr std::size_t kMaxThrownAway = std::size_t{16} * 1024 * 1024;

// TLS 1.2 or newer (RFC 8446, RFC 5246), ciphers of 128 bits or more.
constexpr char kTlsPriorities[] = "SECURE128:-VERS-ALL:+VERS-TLS1.3:+VERS-TLS1.2";

std::string errorText(int code, const std::string &message) {
    return OvraDRCore::toString(OvraPlatform::apiError(code, message));
}

/// What counts as one client.
std::string clientOf(const sockaddr *address) {
    return OvraBase::clientKey(OvraBase::addressText(address));
}

std::string_view headerOf(MHD_Connection *connection, const char *name) {
    const char *value = MHD_lookup_connection_value(connection, MHD_HEADER_KIND, name);
    return value == nullptr ? std::string_view() : std::string_view(value);
}

/// 0 if the length is not announced. One that is not a number, or overflows, exceeds every limit.
std::uint64_t announcedLength(MHD_Connection *connection) {
    const std::string_view text = headerOf(connection, MHD_HTTP_HEADER_CONTENT_LENGTH);
    return text.empty() ? 0 : OvraBase::parseNumber<std::uint64_t>(text).value_or(UINT64_MAX);
}

bool isForm(MHD_Connection *connection) {
    std::string_view type = headerOf(connection, MHD_HTTP_HEADER_CONTENT_TYPE);
    type = type.substr(0, type.find(';'));
    while (!type.empty() && type.back() == ' ') {
        type.remove_suffix(1);
    }
    return type.size() == kFormType.size() &&
           strncasecmp(type.data(), kFormType.data(), type.size()) == 0;
}

struct StopMhd {
    void operator()(MHD_Daemon *daemon) const { MHD_stop_daemon(daemon); }
};

struct DestroyResponse {
    void operator()(MHD_Response *response) const { MHD_destroy_response(response); }
};

/// A few lines a minute: whoever sends rubbish must not fill the log with what the library says of
/// it.
__attribute__((format(printf, 2, 0))) void logLibrary(void * /*self*/, const char *format,
                                                      va_list arguments) {
    static std::mutex mutex;
    static RateLimit lines(10, std::chrono::minutes(1));
    {
        const std::lock_guard lock(mutex);
        if (!lines.allow("", std::chrono::steady_clock::now())) {
            return;
        }
    }
    std::array<char, 512> line{};
    std::vsnprintf(line.data(), line.size(), format, arguments);
    std::string_view text = line.data();
    text = text.substr(0, text.find_last_not_of('\n') + 1);
    OVRA_DEBUG("%.*s", static_cast<int>(text.size()), text.data());
}

} // namespace

/// One request, from its header to the end of its reply.
struct Exchange {
    enum class State { kArriving, kJudged, kWorking, kAnswered };

    MHD_Connection *connection = nullptr;
    Connections::Connection *watched = nullptr;
    Connections *watch = nullptr;
    std::string address;
    bool secure = false;

    std::mutex mutex; ///< of the members below, once the request was handed over
    State state = State::kArriving;
    unsigned int status = MHD_HTTP_OK;
    std::string document;
    std::string body;
    std::size_t announced = 0;      ///< of the body
    std::size_t allowed = 0;        ///< of the body, so far
    bool discard = false;           ///< the body is thrown away: the reply is there already
    bool dropped = false;           ///< the connection ends without a reply
    std::optional<ServedFile> file; ///< what is replied instead of the document
    FilePart part;

    /// Refuses the request; takes effect once its body has arrived.
    void refuse(unsigned int httpStatus, int code, const std::string &message) {
        status = httpStatus;
        document = errorText(code, message);
        discard = true;
    }

    /// Wakes the sleeping connection with the reply, or to its end; the first one counts.
    void answer(std::optional<std::string> text) {
        const std::lock_guard lock(mutex);
        if (state == State::kJudged && !text) {
            discard = true;
        } else if (state != State::kWorking) {
            return;
        }
        dropped = !text;
        document = std::move(text).value_or("");
        state = State::kAnswered;
        watch->enter(watched, Phase::kReplying);
        MHD_resume_connection(connection);
    }

    /// Wakes the connection whose body was judged by its beginning.
    void proceed(std::optional<std::string> refusal, std::size_t limit) {
        const std::lock_guard lock(mutex);
        if (state != State::kJudged) {
            return;
        }
        state = State::kArriving;
        if (refusal) {
            document = *std::move(refusal);
            discard = true;
        } else {
            allowed = limit;
        }
        MHD_resume_connection(connection);
    }
};

struct HttpServer::Impl {
    /// One listening socket.
    struct Endpoint {
        Impl *server = nullptr;
        bool secure = false;
        std::unique_ptr<MHD_Daemon, StopMhd> daemon;
    };

    Impl(Handler requestHandler, const HttpLimits &httpLimits, std::optional<FileSource> fileSource,
         Judge bodyJudge)
        : handler(std::move(requestHandler))
        , judge(std::move(bodyJudge))
        , limits(httpLimits)
        , source(std::move(fileSource))
        , connections(httpLimits.connections) {}
    ~Impl() {
        explicit_bzero(ticketKey.data, ticketKey.size);
        gnutls_free(ticketKey.data);
    }
    Impl(const Impl &) = delete;
    Impl &operator=(const Impl &) = delete;

    bool open(Listener listener, bool secure, const TlsIdentity &identity);
    OvraBase::Expected<void> use(const TlsIdentity &next);

    // What the library calls.
    static MHD_Result onAccept(void *endpoint, const sockaddr *address, socklen_t size);
    static void onConnection(void *endpoint, MHD_Connection *connection, void **context,
                             MHD_ConnectionNotificationCode what);
    static MHD_Result onRequest(void *endpoint, MHD_Connection *connection, const char *url,
                                const char *method, const char *version, const char *data,
                                size_t *size, void **context);
    static void onCompleted(void *endpoint, MHD_Connection *connection, void **context,
                            MHD_RequestTerminationCode how);

    MHD_Result begin(MHD_Connection *connection, bool secure, std::string_view url,
                     std::string_view method, void **context);
    void offerFile(Exchange &exchange, std::string_view url);
    std::size_t take(Exchange &exchange, const char *data, std::size_t size);
    void askJudge(Exchange &exchange);
    std::shared_ptr<Exchange> shared(Exchange &exchange);
    void handOver(Exchange &exchange);
    MHD_Result reply(Exchange &exchange);
    MHD_Result sendFile(Exchange &exchange);
    void end(Exchange *exchange);
    void giveBack(Exchange &exchange);

    const Handler handler;
    const Judge judge;
    const HttpLimits limits;
    const std::optional<FileSource> source;
    Connections connections;
    gnutls_datum_t ticketKey{};
    std::atomic<gnutls_certificate_credentials_t> newest = nullptr; ///< for new connections
    std::vector<TlsCredentials> identities; ///< connections may have the earlier ones
    std::atomic<bool> closing = false;
    std::atomic<std::size_t> buffered = 0;
    std::atomic<std::size_t> files = 0; ///< that are being sent
    std::mutex mutex;
    std::condition_variable ended;
    std::unordered_map<Exchange *, std::shared_ptr<Exchange>> exchanges;
    // Last, so that they are destroyed first: a stopping daemon calls back.
    std::vector<std::unique_ptr<Endpoint>> endpoints;
};

MHD_Result HttpServer::Impl::onAccept(void *endpoint, const sockaddr *address, socklen_t /*size*/) {
    auto &server = *static_cast<Endpoint *>(endpoint)->server;
    return !server.closing && server.connections.admit(clientOf(address)) ? MHD_YES : MHD_NO;
}

void HttpServer::Impl::onConnection(void *endpoint, MHD_Connection *connection, void **context,
                                    MHD_ConnectionNotificationCode what) {
    auto &here = *static_cast<Endpoint *>(endpoint);
    Connections &watch = here.server->connections;
    if (what == MHD_CONNECTION_NOTIFY_CLOSED) {
        watch.close(static_cast<Connections::Connection *>(*context));
        return;
    }
    const MHD_ConnectionInfo *fd =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD);
    const MHD_ConnectionInfo *client =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    *context = watch.open(fd->connect_fd, clientOf(client->client_addr));
    if (here.secure) {
        const MHD_ConnectionInfo *tls =
            MHD_get_connection_info(connection, MHD_CONNECTION_INFO_GNUTLS_SESSION);
        auto *const session = static_cast<gnutls_session_t>(tls->tls_session);
        gnutls_session_ticket_enable_server(session, &here.server->ticketKey);
        // Instead of those that the library has set, and cannot change.
        gnutls_credentials_set(session, GNUTLS_CRD_CERTIFICATE, here.server->newest.load());
    }
}

MHD_Result HttpServer::Impl::onRequest(void *endpoint, MHD_Connection *connection, const char *url,
                                       const char *method, const char * /*version*/,
                                       const char *data, size_t *size, void **context) {
    auto &here = *static_cast<Endpoint *>(endpoint);
    Impl &server = *here.server;
    try {
        if (*context == nullptr) {
            return server.begin(connection, here.secure, url, method, context);
        }
        Exchange &exchange = *static_cast<Exchange *>(*context);
        bool ready = false;
        {
            const std::lock_guard lock(exchange.mutex);
            if (exchange.state == Exchange::State::kJudged) {
                return MHD_YES; // the next part waits with it
            }
            ready = exchange.discard || exchange.state == Exchange::State::kAnswered;
            if (*size > 0 && exchange.dropped) {
                return MHD_NO;
            }
        }
        if (*size > 0) {
            *size -= server.take(exchange, data, *size);
            return MHD_YES;
        }
        if (ready) {
            return server.reply(exchange);
        }
        server.handOver(exchange);
        return MHD_YES;
    } catch (const std::exception &error) {
        OVRA_ERR("A request could not be served: [%s]", error.what());
        return MHD_NO;
    }
}

void HttpServer::Impl::onCompleted(void *endpoint, MHD_Connection * /*connection*/, void **context,
                                   MHD_RequestTerminationCode /*how*/) {
    if (*context != nullptr) {
        static_cast<Endpoint *>(endpoint)->server->end(static_cast<Exchange *>(*context));
        *context = nullptr;
    }
}

/// The header has arrived.
MHD_Result HttpServer::Impl::begin(MHD_Connection *connection, bool secure, std::string_view url,
                                   std::string_view method, void **context) {
    auto exchange = std::make_shared<Exchange>();
    const MHD_ConnectionInfo *watched =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_SOCKET_CONTEXT);
    const MHD_ConnectionInfo *client =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    exchange->connection = connection;
    exchange->watch = &connections;
    exchange->watched = static_cast<Connections::Connection *>(watched->socket_context);
    exchange->address = OvraBase::addressText(client->client_addr);
    exchange->secure = secure;
    connections.beginRequest(exchange->watched);

    const std::uint64_t length = announcedLength(connection);
    exchange->announced = length;
    exchange->allowed = judge ? limits.unjudged : limits.body;
    const bool reads = method == MHD_HTTP_METHOD_GET || method == MHD_HTTP_METHOD_HEAD;
    if (reads && source && url.starts_with(source->prefix)) {
        offerFile(*exchange, url);
    } else if (url != kEntryPoint) {
        exchange->refuse(MHD_HTTP_NOT_FOUND, APIError::kBadRequest,
                         "there is nothing here: the web API is at /webapi/query.cgi");
    } else if (reads) {
        exchange->refuse(MHD_HTTP_OK, APIError::kBadRequest, "a call is made with POST");
    } else if (method != MHD_HTTP_METHOD_POST) {
        exchange->refuse(MHD_HTTP_METHOD_NOT_ALLOWED, APIError::kBadRequest,
                         "a call is made with POST");
    } else if (!isForm(connection)) {
        exchange->refuse(MHD_HTTP_OK, APIError::kBadRequest,
                         "the body has to be of the type application/x-www-form-urlencoded: no "
                         "call takes a file");
    } else if (length > limits.body) {
        exchange->refuse(MHD_HTTP_OK, APIError::kTooLarge,
                         "the request is too large: send less at once");
    }
    Exchange *const handle = exchange.get();
    {
        const std::lock_guard lock(mutex);
        exchanges.emplace(handle, std::move(exchange));
    }
    *context = handle;
    // A reply before the end of the body ends the connection.
    return handle->discard && length > kMaxThrownAway ? reply(*handle) : MHD_YES;
}

/// A part of the body. \return how much of it was taken; the rest comes again.
std::size_t HttpServer::Impl::take(Exchange &exchange, const char *data, std::size_t size) {
    if (exchange.discard) {
        return size;
    }
    const std::size_t before = exchange.body.size();
    const std::size_t taken = std::min(size, exchange.allowed - before);
    if (before + size > limits.body) {
        exchange.refuse(MHD_HTTP_OK, APIError::kTooLarge,
                        "the request is too large: send less at once");
    } else if (buffered + taken > limits.bodies) {
        exchange.refuse(MHD_HTTP_OK, APIError::kTooBusy,
                        "too many large requests arrive at once: try again later");
    } else {
        exchange.body.reserve(std::min(exchange.announced, exchange.allowed));
        exchange.body.append(data, taken);
        buffered += taken;
        connections.progress(exchange.watched, taken);
        if (taken < size) {
            askJudge(exchange);
        }
        return taken;
    }
    giveBack(exchange);
    return size;
}

/// Has the beginning of the body judged while the connection sleeps, its deadline running on.
void HttpServer::Impl::askJudge(Exchange &exchange) {
    const std::shared_ptr<Exchange> held = shared(exchange);
    {
        const std::lock_guard lock(exchange.mutex);
        exchange.state = Exchange::State::kJudged;
        MHD_suspend_connection(exchange.connection);
    }
    if (closing) {
        held->answer(std::nullopt);
        return;
    }
    judge({exchange.body, exchange.address, exchange.secure},
          [held, limit = limits.body](std::optional<std::string> refusal) {
              held->proceed(std::move(refusal), limit);
          });
}

/// Wipes and frees the body of a request.
void HttpServer::Impl::giveBack(Exchange &exchange) {
    buffered -= exchange.body.size();
    OvraBase::wipe(exchange.body);
    exchange.body = std::string();
}

std::shared_ptr<Exchange> HttpServer::Impl::shared(Exchange &exchange) {
    const std::lock_guard lock(mutex);
    return exchanges.at(&exchange);
}

/// The request is complete.
void HttpServer::Impl::handOver(Exchange &exchange) {
    const std::shared_ptr<Exchange> held = shared(exchange);
    HttpRequest request;
    {
        const std::lock_guard lock(exchange.mutex);
        buffered -= exchange.body.size();
        request = {std::move(exchange.body), exchange.address, exchange.secure};
        exchange.body = std::string();
        exchange.state = Exchange::State::kWorking;
        connections.enter(exchange.watched, Phase::kWorking);
        MHD_suspend_connection(exchange.connection);
    }
    // From here on the exchange may be answered, or even destroyed, at any moment.
    const Answer answer = [held](std::string document) { held->answer(std::move(document)); };
    if (closing) {
        held->answer(std::nullopt);
        return;
    }
    handler(std::move(request), answer);
}

/// Makes a file of the source the reply, or refuses.
void HttpServer::Impl::offerFile(Exchange &exchange, std::string_view url) {
    std::optional<ServedFile> file = source->open(url);
    if (!file) {
        exchange.refuse(MHD_HTTP_NOT_FOUND, APIError::kBadRequest, source->absentText);
        return;
    }
    // A range that holds only for one version of a file: ours have none.
    const bool conditional = !headerOf(exchange.connection, MHD_HTTP_HEADER_IF_RANGE).empty();
    exchange.part =
        partOf(conditional ? "" : headerOf(exchange.connection, MHD_HTTP_HEADER_RANGE), file->size);
    if (exchange.part.kind == FilePart::Kind::kUnsatisfiable) {
        exchange.refuse(MHD_HTTP_RANGE_NOT_SATISFIABLE, APIError::kBadRequest,
                        "the file ends before this range: ask for less");
        return;
    }
    if (files.fetch_add(1) >= source->atOnce) {
        --files;
        exchange.refuse(MHD_HTTP_SERVICE_UNAVAILABLE, APIError::kTooBusy, source->busyText);
        return;
    }
    exchange.file = std::move(file);
    exchange.discard = true;
}

MHD_Result HttpServer::Impl::sendFile(Exchange &exchange) {
    connections.enter(exchange.watched, Phase::kSending);
    const FilePart &part = exchange.part;
    const std::unique_ptr<MHD_Response, DestroyResponse> response(
        MHD_create_response_from_fd_at_offset64(part.length, exchange.file->fd.get(), part.first));
    if (response == nullptr) {
        return MHD_NO;
    }
    // The response closes it.
    exchange.file->fd.release();
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_CONTENT_TYPE,
                            "application/octet-stream");
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_ACCEPT_RANGES, "bytes");
    if (part.kind == FilePart::Kind::kWhole) {
        return MHD_queue_response(exchange.connection, MHD_HTTP_OK, response.get());
    }
    const std::string range = "bytes " + std::to_string(part.first) + "-" +
                              std::to_string(part.first + part.length - 1) + "/" +
                              std::to_string(exchange.file->size);
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_CONTENT_RANGE, range.c_str());
    return MHD_queue_response(exchange.connection, MHD_HTTP_PARTIAL_CONTENT, response.get());
}

MHD_Result HttpServer::Impl::reply(Exchange &exchange) {
    if (exchange.file) {
        return sendFile(exchange);
    }
    if (exchange.dropped) {
        return MHD_NO;
    }
    connections.enter(exchange.watched, Phase::kReplying);
    const std::unique_ptr<MHD_Response, DestroyResponse> response(MHD_create_response_from_buffer(
        exchange.document.size(), exchange.document.data(), MHD_RESPMEM_MUST_COPY));
    if (response == nullptr) {
        return MHD_NO;
    }
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_CONTENT_TYPE, "application/json");
    MHD_add_response_header(response.get(), MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
    MHD_add_response_header(response.get(), "X-Content-Type-Options", "nosniff");
    if (exchange.status == MHD_HTTP_METHOD_NOT_ALLOWED) {
        MHD_add_response_header(response.get(), MHD_HTTP_HEADER_ALLOW, "GET, HEAD, POST");
    }
    return MHD_queue_response(exchange.connection, exchange.status, response.get());
}

/// The reply was sent, or the connection is gone.
void HttpServer::Impl::end(Exchange *exchange) {
    giveBack(*exchange);
    files -= exchange->file ? 1 : 0;
    connections.enter(exchange->watched, Phase::kIdle);
    const std::lock_guard lock(mutex);
    exchanges.erase(exchange);
    ended.notify_all();
}

OvraBase::Expected<void> HttpServer::Impl::use(const TlsIdentity &next) {
    auto credentials = next.credentials();
    if (!credentials) {
        return OvraBase::Unexpected(credentials.error());
    }
    const std::lock_guard lock(mutex);
    newest = credentials->get();
    identities.push_back(std::move(*credentials));
    return {};
}

bool HttpServer::Impl::open(Listener listener, bool secure, const TlsIdentity &identity) {
    auto endpoint = std::make_unique<Endpoint>();
    endpoint->server = this;
    endpoint->secure = secure;
    const unsigned int flags = MHD_USE_EPOLL_INTERNAL_THREAD | MHD_ALLOW_SUSPEND_RESUME |
                               MHD_USE_ERROR_LOG | (secure ? unsigned{MHD_USE_TLS} : 0U);
    // Our own limit acts first; the library divides its limit between its threads.
    const auto mostConnections =
        static_cast<unsigned int>(2 * limits.connections.total * kThreadsPerListener);
    const std::array<MHD_OptionItem, 4> tlsOptions = {{
        {MHD_OPTION_HTTPS_MEM_KEY, 0, const_cast<char *>(identity.key.get().c_str())},
        {MHD_OPTION_HTTPS_MEM_CERT, 0, const_cast<char *>(identity.certificate.c_str())},
        {MHD_OPTION_HTTPS_PRIORITIES, 0, const_cast<char *>(kTlsPriorities)},
        {MHD_OPTION_END, 0, nullptr},
    }};
    const std::array<MHD_OptionItem, 1> noOptions = {{{MHD_OPTION_END, 0, nullptr}}};
    const int socket = listener.socket.get();
    // clang-format off
    endpoint->daemon.reset(MHD_start_daemon(
        flags, 0, onAccept, endpoint.get(), onRequest, endpoint.get(),
        MHD_OPTION_EXTERNAL_LOGGER, logLibrary, nullptr,
        MHD_OPTION_LISTEN_SOCKET, socket,
        MHD_OPTION_THREAD_POOL_SIZE, kThreadsPerListener,
        MHD_OPTION_CONNECTION_LIMIT, mostConnections,
        MHD_OPTION_CONNECTION_MEMORY_LIMIT, kConnectionMemory,
        MHD_OPTION_CONNECTION_TIMEOUT, kInactivity,
        MHD_OPTION_STRICT_FOR_CLIENT, 1,
        MHD_OPTION_NOTIFY_CONNECTION, onConnection, endpoint.get(),
        MHD_OPTION_NOTIFY_COMPLETED, onCompleted, endpoint.get(),
        MHD_OPTION_ARRAY, secure ? tlsOptions.data() : noOptions.data(),
        MHD_OPTION_END));
    // clang-format on
    if (endpoint->daemon == nullptr) {
        return false;
    }
    // The library closes the socket.
    listener.socket.release();
    endpoints.push_back(std::move(endpoint));
    return true;
}

HttpServer::HttpServer(Handler handler, const HttpLimits &limits, std::optional<FileSource> files,
                       Judge judge)
    : impl_(
          std::make_unique<Impl>(std::move(handler), limits, std::move(files), std::move(judge))) {}

HttpServer::~HttpServer() {
    stop();
}

OvraBase::Expected<void> HttpServer::start(std::vector<Listener> https, std::vector<Listener> http,
                                           const TlsIdentity &identity) {
    if (gnutls_session_ticket_key_generate(&impl_->ticketKey) != GNUTLS_E_SUCCESS) {
        return OvraBase::Unexpected(
            {"the key for TLS session tickets cannot be made: is the kernel "
             "out of random numbers?"});
    }
    if (auto taken = https.empty() ? OvraBase::Expected<void>() : impl_->use(identity); !taken) {
        return taken;
    }
    for (const bool secure : {true, false}) {
        for (Listener &listener : secure ? https : http) {
            if (!impl_->open(std::move(listener), secure, identity)) {
                return OvraBase::Unexpected({"the HTTP server cannot start: the log says why"});
            }
        }
    }
    return {};
}

OvraBase::Expected<void> HttpServer::renew(const TlsIdentity &identity) {
    return impl_->use(identity);
}

void HttpServer::adopt(ConnectedClient client) {
    for (const auto &endpoint : impl_->endpoints) {
        if (endpoint->secure) {
            // The library closes it, even if it does not take it.
            MHD_add_connection(endpoint->daemon.get(), client.fd.release(),
                               reinterpret_cast<const sockaddr *>(&client.address), client.size);
            return;
        }
    }
}

void HttpServer::quiesce() {
    // Not by MHD_quiesce_daemon(): in 0.9.75 that aborts the process when a thread of the daemon
    // wakes up at the same moment and takes the socket out of its epoll set first.
    impl_->closing = true;
}

void HttpServer::stop() {
    quiesce();
    std::vector<std::shared_ptr<Exchange>> underWay;
    {
        const std::lock_guard lock(impl_->mutex);
        for (const auto &[handle, exchange] : impl_->exchanges) {
            underWay.push_back(exchange);
        }
    }
    for (const std::shared_ptr<Exchange> &exchange : underWay) {
        exchange->answer(std::nullopt);
    }
    {
        std::unique_lock lock(impl_->mutex);
        impl_->ended.wait_for(lock, kFlushTime, [this] { return impl_->exchanges.empty(); });
    }
    impl_->endpoints.clear();
}

} // namespace OvraService
