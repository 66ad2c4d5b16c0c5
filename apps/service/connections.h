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

/// The limit of connections, and of the time each phase may take.
struct ConnectionLimits {
    /// From the connection, or the first header, to the end of the request: an inactivity time-out
    /// alone would let a client send a byte now and then forever.
    std::chrono::milliseconds arriving{20'000};
    /// Between two requests, until the header of the second is complete. Longer than this system's
    /// clients keep an idle connection, so that the client closes it.
    std::chrono::milliseconds idle{60'000};
    std::chrono::milliseconds replying{30'000}; ///< from the reply's first byte to its last
    std::chrono::milliseconds sending{600'000}; ///< the same of a test file
    std::size_t total = 1024;
    std::size_t perClient = 768;
};

/// The open connections, and a thread that shuts down overdue ones.
///
/// At the limit, the connection that has waited longest for its client makes room for the next: a
/// silent or slow client never keeps another one out. Thread-safe.
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

    /// Whether a connection of the client may be opened; makes room if needed.
    [[nodiscard]] bool admit(const std::string &client);
    /// \param fd  owned by the caller, open until close() has returned
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
    std::size_t live_ = 0; ///< open ones not yet shut down
    std::unordered_map<std::string, std::size_t> liveOfClient_;
    std::thread thread_;
};

} // namespace OvraService
