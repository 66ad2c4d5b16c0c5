// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/connections.h"
#include "service/listener.h"
#include "service/tls_identity.h"

#include <sys/socket.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraService {

struct HttpLimits {
    ConnectionLimits connections;
    std::size_t body = std::size_t{1} * 1024 * 1024;
    /// Of a body, before the judge has seen it: what a log-in needs.
    std::size_t unjudged = std::size_t{16} * 1024;
    /// For all bodies not handed over yet, together.
    std::size_t bodies = std::size_t{64} * 1024 * 1024;
};

/// A request to the entry point of the web API.
struct HttpRequest {
    std::string body;
    std::string address; ///< numeric address of the client
    bool secure = false; ///< came over TLS
};

/// A file that is sent unchanged.
struct ServedFile {
    OvraBase::UniqueFd fd;
    std::uint64_t size = 0;
};

/// Files that a program serves besides the web API.
struct FileSource {
    std::string prefix; ///< of its URL paths
    /// Opens the file that a URL path names, its escapes resolved; std::nullopt if there is none.
    std::function<std::optional<ServedFile>(std::string_view path)> open;
    std::size_t atOnce = 0; ///< how many are sent at once
    std::string absentText; ///< what clients are told if there is no such file
    std::string busyText;   ///< and if too many are being sent already
};

/// A client whose connection did not come through a listening socket.
struct ConnectedClient {
    OvraBase::UniqueFd fd;
    sockaddr_storage address{};
    socklen_t size = 0;
};

/// The HTTP side of a daemon: POST of a form to /webapi/query.cgi, answered with a JSON document,
/// and GET of the files of a source, if the daemon has one. Everything else is refused, also with a
/// JSON document.
///
/// A few threads wait for the network, none for a handler. A connection sleeps while its request is
/// handled.
class HttpServer {
public:
    /// Ends the request with a JSON text; called once, in any thread, even after the server is
    /// gone.
    using Answer = std::function<void(std::string document)>;
    /// Receives every complete request, in a thread of the server: it must not wait.
    using Handler = std::function<void(HttpRequest request, Answer answer)>;

    /// Receives the first HttpLimits::unjudged bytes of a longer body, and the address, and says
    /// whether the rest is taken in: a refusal, or std::nullopt. Like a handler otherwise.
    using Verdict = std::function<void(std::optional<std::string> refusal)>;
    using Judge = std::function<void(HttpRequest beginning, Verdict verdict)>;

    /// \param judge  if there is none, every body up to HttpLimits::body is taken in
    HttpServer(Handler handler, const HttpLimits &limits,
               std::optional<FileSource> files = std::nullopt, Judge judge = {});
    HttpServer(const HttpServer &) = delete;
    HttpServer &operator=(const HttpServer &) = delete;
    /// Stops.
    ~HttpServer();

    /// Begins to serve on the sockets.
    /// \param identity  for those that speak TLS; must outlive the server
    [[nodiscard]] OvraBase::Expected<void>
    start(std::vector<Listener> https, std::vector<Listener> http, const TlsIdentity &identity);
    /// New connections get this key and certificate; those that there are keep theirs. In any
    /// thread while the server runs.
    [[nodiscard]] OvraBase::Expected<void> renew(const TlsIdentity &identity);
    /// Serves an already connected client like one of the https sockets. In any thread while the
    /// server runs.
    void adopt(ConnectedClient client);
    /// Accepts no further connections and ends those of further requests; those in progress go on.
    void quiesce();
    /// Ends the connections of the requests still in progress without an answer, which would be
    /// taken for the last word on them, gives the other replies half a second to leave, and closes
    /// all connections.
    void stop();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraService
