// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <unordered_map>

namespace OvraService {

/// How many connections there may be, and how long each phase of one may last.
struct ConnectionLimits {
    /// From the connection, or the first header, to the end of the request: a time-out of
    /// inactivity alone would let a client send a byte now and then for ever.
    std::chrono::milliseconds arriving{20'000};
    /// Between two requests, until the header of the second is complete. Longer than clients of
    /// this system keep an idle connection, so that it is they who close it.
    std::chrono::milliseconds idle{60'000};
    std::chrono::milliseconds replying{30'000}; ///< from the reply's first byte to its last
    std::chrono::milliseconds sending{600'000}; ///< the same of a test file
    std::size_t total = 1024;
    std::size_t perClient = 768;
};

/// The open connections, and a thread that shuts down those whose time is over.
///
/// When there are as many as there may be, the one that has been waiting for its client for the
/// longest time makes room for the next: a client that says nothing, or says it slowly, never keeps
/// another one out. All operations are safe for threads.
class Connections {
public:
    enum class Phase {
        kArriving, ///< waits for the client: handshake, header, body
        kIdle,     ///< waits for the client's next request
        kWorking,  ///< waits for us, without a deadline: the queues bound it
        kReplying, ///< waits for the client to take the reply
        kSending,  ///< the same for a test file
    };
    struct Connection;

    explicit Connections(const ConnectionLimits &limits);
    Connections(const Connections &) = delete;
    Connections &operator=(const Connections &) = delete;
    ~Connections();

    /// Whether a connection of the client may be opened; makes room when that is needed.
    [[nodiscard]] bool admit(const std::string &client);
    /// \param fd  stays the caller's, open until close() has returned
    Connection *open(int fd, const std::string &client);
    void close(Connection *connection);

    /// A request begins: an idle connection's deadline becomes that of arriving, a new connection's
    /// stays.
    void beginRequest(Connection *connection);
    void enter(Connection *connection, Phase phase);

private:
    using Clock = std::chrono::steady_clock;

    void watch();
    void shutOverdue();
    std::optional<std::chrono::milliseconds> limitOf(Phase phase) const;
    void uncount(Connection &connection);
    void shut(Connection &connection);
    [[nodiscard]] bool makeRoom(const std::string *client);

    const ConnectionLimits limits_;
    std::mutex mutex_;
    std::condition_variable stopped_;
    bool stopping_ = false;
    std::unordered_map<const Connection *, std::unique_ptr<Connection>> open_;
    std::size_t live_ = 0; ///< of the open ones, those that were not shut down
    std::unordered_map<std::string, std::size_t> liveOfClient_;
    std::thread thread_;
};

} // namespace OvraService
