// SPDX-License-Identifier: Apache-2.0
#include "service/connections.h"

#include <sys/socket.h>

#include <utility>

namespace OvraService {

namespace {

constexpr std::chrono::milliseconds kTick{250};

} // namespace

struct Connections::Connection {
    int fd = -1;
    std::string client;
    Phase phase = Phase::kArriving;
    Clock::time_point since;
    bool shut = false; ///< no longer counted
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
    connection->since = Clock::now();
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
        connection->since = Clock::now();
    }
}

void Connections::enter(Connection *connection, Phase phase) {
    const std::lock_guard lock(mutex_);
    connection->phase = phase;
    connection->since = Clock::now();
}

std::optional<std::chrono::milliseconds> Connections::limitOf(Phase phase) const {
    switch (phase) {
    case Phase::kArriving:
        return limits_.arriving;
    case Phase::kIdle:
        return limits_.idle;
    case Phase::kReplying:
        return limits_.replying;
    case Phase::kSending:
        return limits_.sending;
    case Phase::kWorking:
        break;
    }
    return std::nullopt;
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
        const auto limit = limitOf(connection->phase);
        if (!connection->shut && limit && now - connection->since > *limit) {
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
