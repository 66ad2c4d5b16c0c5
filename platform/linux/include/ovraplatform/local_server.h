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

/// Answers one local call with a reply document. Runs in a thread of the server, several at once;
/// what it throws is answered with error 100.
using LocalHandler = std::function<Json::Value(const LocalCall &call)>;

/// The daemon's side of its Unix socket: serves processes of root and of its own user.
///
/// A fixed number of threads take a connection each, read one call (10 seconds at most) and write
/// one reply; callers beyond that number wait in the socket's queue.
class OVRAPLATFORM_EXPORT LocalServer {
public:
    static constexpr unsigned int kThreads = 16;

    /// \param path     the socket file; its folder is made, mode 0700, when missing
    /// \param handler  called for every call that is well formed
    LocalServer(std::string path, LocalHandler handler, unsigned int threads = kThreads);
    LocalServer(const LocalServer &) = delete;
    LocalServer &operator=(const LocalServer &) = delete;
    /// Stops.
    ~LocalServer();

    /// Takes the socket (mode 0600) and begins to serve. A socket file that a dead process left is
    /// replaced; one on which somebody answers is not.
    /// \return why it cannot start, in one sentence
    [[nodiscard]] tl::expected<void, std::string> start();
    /// Accepts nothing more, waits until the calls under way are answered, removes the socket file.
    void stop();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace OvraPlatform
