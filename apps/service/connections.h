// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <unordered_map>

namespace OvraService {

/// The limit of connections, and of the time each phase may take.
struct ConnectionLimits {
    /// From the connection to the end of the first request, TLS handshake included, and from the
    /// first byte to the end of every further one: an inactivity time-out alone would let a client
    /// send a byte now and then forever.
    std::chrono::milliseconds arriving{15'000};
    /// Between two requests, until the first byte of the second. Longer than this system's clients
    /// keep an idle connection, so that the client closes it.
    std::chrono::milliseconds idle{40'000};
    std::chrono::milliseconds replying{15'000}; ///< from the reply's first byte to its last
    std::chrono::milliseconds sending{600'000}; ///< of a test file, however slow its client
    /// Bytes a second. A body or reply that travels this fast has all the time that it needs: the
    /// bytes that have passed lengthen the time for the rest. The least of what links between
    /// appliances carry, 64 kbit/s.
    std::size_t leastRate = 8192;
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
        kSending,  ///< the same for a test file, which has its own limit besides
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

    /// A request begins: an idle connection's deadline becomes that of arriving, unless its first
    /// byte came earlier; a new connection's stays.
    void beginRequest(Connection *connection);
    /// A part of the request's body has arrived.
    void progress(Connection *connection, std::size_t bytes);
    void enter(Connection *connection, Phase phase);

private:
    using Clock = std::chrono::steady_clock;

    void watch();
    void shutOverdue();
    void look(Connection &connection, Clock::time_point now) const;
    void lengthen(Connection &connection, std::uint64_t bytes, Clock::time_point now) const;
    bool isOverdue(const Connection &connection, Clock::time_point now) const;
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
