// SPDX-License-Identifier: Apache-2.0
#include "service/connections.h"

#include <linux/tcp.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <algorithm>
#include <cstddef>
#include <utility>

namespace OvraService {

namespace {

constexpr std::chrono::milliseconds kTick{250};

/// Bytes that have passed a connection (RFC 4898).
struct Traffic {
    std::uint64_t received = 0;
    std::uint64_t taken = 0; ///< sent, and acknowledged by the client's kernel
};

/// Nothing for a socket that does not count.
Traffic trafficOf(int fd) {
    tcp_info info{};
    socklen_t size = sizeof info;
    constexpr std::size_t kNeeded =
        offsetof(tcp_info, tcpi_bytes_received) + sizeof info.tcpi_bytes_received;
    if (getsockopt(fd, IPPROTO_TCP, TCP_INFO, &info, &size) != 0 || size < kNeeded) {
        return {};
    }
    return {info.tcpi_bytes_received, info.tcpi_bytes_acked};
}

} // namespace

struct Connections::Connection {
    int fd = -1;
    std::string client;
    Phase phase = Phase::kArriving;
    Clock::time_point since; ///< later by the time that the bytes since then may take
    Clock::time_point begun; ///< the phase
    Traffic traffic;         ///< received by the end of the last request; taken by the last look
    bool shut = false;       ///< no longer counted
};

Connections::Connections(const ConnectionLimits &limits)
    : limits_(limits)
    , thread_([this] { watch(); }) {}

Connections::~Connections() {
    {
        const std::lock_guard lock(mutex_);
        stopping_ = true;
    }
    stopped_.notify_all();
    thread_.join();
}

bool Connections::admit(const std::string &client) {
    const std::lock_guard lock(mutex_);
    const auto ofClient = liveOfClient_.find(client);
    if (ofClient != liveOfClient_.end() && ofClient->second >= limits_.perClient &&
        !makeRoom(&client)) {
        return false;
    }
    return live_ < limits_.total || makeRoom(nullptr);
}

Connections::Connection *Connections::open(int fd, const std::string &client) {
    auto connection = std::make_unique<Connection>();
    connection->fd = fd;
    connection->client = client;
    connection->since = connection->begun = Clock::now();
    const std::lock_guard lock(mutex_);
    ++live_;
    ++liveOfClient_[client];
    Connection *const handle = connection.get();
    open_.emplace(handle, std::move(connection));
    return handle;
}

void Connections::close(Connection *connection) {
    const std::lock_guard lock(mutex_);
    const auto found = open_.find(connection);
    if (found == open_.end()) {
        return;
    }
    uncount(*found->second);
    open_.erase(found);
}

void Connections::beginRequest(Connection *connection) {
    const std::lock_guard lock(mutex_);
    if (connection->phase == Phase::kIdle) {
        connection->phase = Phase::kArriving;
        connection->since = connection->begun = Clock::now();
    }
}

void Connections::progress(Connection *connection, std::size_t bytes) {
    const std::lock_guard lock(mutex_);
    lengthen(*connection, bytes, Clock::now());
}

void Connections::enter(Connection *connection, Phase phase) {
    const std::lock_guard lock(mutex_);
    const auto now = Clock::now();
    if (connection->phase == Phase::kArriving) {
        connection->traffic.received = trafficOf(connection->fd).received;
    }
    if (phase == Phase::kReplying || phase == Phase::kSending) {
        connection->traffic.taken = trafficOf(connection->fd).taken;
    }
    connection->phase = phase;
    connection->since = connection->begun = now;
    look(*connection, now); // the next request may have begun already
}

/// Gives more time for bytes at the least rate, but never more than from now on: who stalls after a
/// fast start has no credit.
void Connections::lengthen(Connection &connection, std::uint64_t bytes,
                           Clock::time_point now) const {
    const std::chrono::duration<double> earned(static_cast<double>(bytes) /
                                               static_cast<double>(limits_.leastRate));
    connection.since =
        std::min(now, connection.since + std::chrono::duration_cast<Clock::duration>(earned));
}

/// Notes what has passed since the last look.
void Connections::look(Connection &connection, Clock::time_point now) const {
    const bool sends = connection.phase == Phase::kReplying || connection.phase == Phase::kSending;
    if (connection.shut || (!sends && connection.phase != Phase::kIdle)) {
        return;
    }
    const Traffic traffic = trafficOf(connection.fd);
    if (sends) {
        const std::uint64_t before = std::exchange(connection.traffic.taken, traffic.taken);
        lengthen(connection, traffic.taken - std::min(before, traffic.taken), now);
    } else if (traffic.received > connection.traffic.received) {
        connection.phase = Phase::kArriving;
        connection.since = connection.begun = now;
    }
}

bool Connections::isOverdue(const Connection &connection, Clock::time_point now) const {
    const auto waited = now - connection.since;
    switch (connection.phase) {
    case Phase::kArriving:
        return waited > limits_.arriving;
    case Phase::kIdle:
        return waited > limits_.idle;
    case Phase::kReplying:
        return waited > limits_.replying;
    case Phase::kSending:
        return waited > limits_.replying || now - connection.begun > limits_.sending;
    case Phase::kWorking:
        break;
    }
    return false;
}

void Connections::uncount(Connection &connection) {
    if (std::exchange(connection.shut, true)) {
        return;
    }
    --live_;
    const auto ofClient = liveOfClient_.find(connection.client);
    if (--ofClient->second == 0) {
        liveOfClient_.erase(ofClient);
    }
}

/// Ends both directions; the server then sees the end of the connection and closes it.
void Connections::shut(Connection &connection) {
    uncount(connection);
    shutdown(connection.fd, SHUT_RDWR);
}

/// Shuts down the connection that has waited longest for its client.
/// \param client  among those of this client; null: of everybody
bool Connections::makeRoom(const std::string *client) {
    Connection *victim = nullptr;
    for (const auto &[handle, connection] : open_) {
        const bool waits =
            connection->phase == Phase::kArriving || connection->phase == Phase::kIdle;
        if (waits && !connection->shut && (client == nullptr || connection->client == *client) &&
            (victim == nullptr || connection->since < victim->since)) {
            victim = connection.get();
        }
    }
    if (victim == nullptr) {
        return false;
    }
    shut(*victim);
    return true;
}

void Connections::shutOverdue() {
    const auto now = Clock::now();
    for (const auto &[handle, connection] : open_) {
        look(*connection, now);
        if (!connection->shut && isOverdue(*connection, now)) {
            shut(*connection);
        }
    }
}

void Connections::watch() {
    std::unique_lock lock(mutex_);
    while (!stopped_.wait_for(lock, kTick, [this] { return stopping_; })) {
        shutOverdue();
    }
}

} // namespace OvraService
