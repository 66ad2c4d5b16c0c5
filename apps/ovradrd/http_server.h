// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "deadlines.h"
#include "listener.h"
#include "tls_identity.h"

#include <sys/socket.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace Ovradrd {

struct HttpLimits {
    ConnectionLimits connections;
    std::size_t body = std::size_t{1} * 1024 * 1024;
    /// Of all bodies together that have not been handed over yet.
    std::size_t bodies = std::size_t{64} * 1024 * 1024;
    std::size_t files = 16; ///< test files sent at the same time; 0: none is served
};

/// A request to the entry point of the web API.
struct HttpRequest {
    std::string body;
    std::string address; ///< numeric address of the client
    bool secure = false; ///< came over TLS
};

/// A client whose connection came another way than through a listening socket.
struct ConnectedClient {
    OvraPlatform::UniqueFd fd;
    sockaddr_storage address{};
    socklen_t size = 0;
};

/// The HTTP side of the daemon: POST of a form to /webapi/query.cgi, answered with a JSON document,
/// and GET of the files for measuring the link (test_files.h). Everything else is refused here,
/// also with a JSON document; no other file can be reached.
///
/// A few threads wait for the network, none for a handler. While a request is being worked on its
/// connection sleeps.
class HttpServer {
public:
    /// Ends the request with a JSON text; called once, in any thread, also after the server is
    /// gone.
    using Answer = std::function<void(std::string document)>;
    /// Gets every request that is whole, in a thread of the server: it must not wait.
    using Handler = std::function<void(HttpRequest request, Answer answer)>;

    HttpServer(Handler handler, const HttpLimits &limits);
    HttpServer(const HttpServer &) = delete;
    HttpServer &operator=(const HttpServer &) = delete;
    /// Stops.
    ~HttpServer();

    /// Begins to serve on the sockets.
    /// \param identity  for those that speak TLS; has to live as long as the server does
    /// \param why       takes one sentence when it cannot start
    bool start(std::vector<Listener> https, std::vector<Listener> http, const TlsIdentity &identity,
               std::string &why);
    /// Serves a client that is connected already, as one of the https sockets. In any thread while
    /// the server is started and not stopped.
    void adopt(ConnectedClient client);
    /// Takes no further connections and refuses further requests; those under way go on.
    void quiesce();
    /// Ends every request still under way with a refusal, gives the replies half a second to leave,
    /// and closes all connections.
    void stop();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace Ovradrd
