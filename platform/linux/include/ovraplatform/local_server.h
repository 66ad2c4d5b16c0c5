// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/api_call.h"
#include "ovraplatform/export.h"

#include <json/value.h>
#include <tl/expected.hpp>

#include <functional>
#include <memory>
#include <string>

namespace OvraPlatform {

/// Answers one local call with a reply document. Runs in the server's threads, several at once; an
/// exception is answered with error 100.
using LocalHandler = std::function<Json::Value(const LocalCall &call)>;

/// The daemon's side of its Unix socket: serves processes of root and of its own user.
///
/// A fixed number of threads each take a connection, read one call (10 seconds at most) and write
/// one reply; callers beyond that number wait in the socket's queue.
class OVRAPLATFORM_EXPORT LocalServer {
public:
    static constexpr unsigned int kThreads = 16;

    /// \param path     the socket file; its folder is created, mode 0700, if missing
    /// \param handler  called for every well-formed call
    LocalServer(std::string path, LocalHandler handler, unsigned int threads = kThreads);
    LocalServer(const LocalServer &) = delete;
    LocalServer &operator=(const LocalServer &) = delete;
    /// Stops.
    ~LocalServer();

    /// Creates the socket (mode 0600) and begins to serve. Replaces a socket file left by a dead
    /// process, but not one that is still served.
    /// \return the reason if it cannot start
    [[nodiscard]] tl::expected<void, std::string> start();
    /// Stops accepting, waits until the calls in progress are answered, removes the socket file.
    void stop();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraPlatform
