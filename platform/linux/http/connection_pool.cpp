// SPDX-License-Identifier: Apache-2.0
#include "http/connection_pool.h"

#include <pthread.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <mutex>
#include <utility>

namespace OvraPlatform {

ConnectionPool &ConnectionPool::instance() {
    const OvraDRCore::NoFork noFork; // a child would wait for an initialisation under way
    static auto *pool = new ConnectionPool();
    return *pool;
}

ConnectionPool::ConnectionPool() {
    pthread_atfork(nullptr, nullptr, [] { instance().dropAllInChild(); });
}

void ConnectionPool::dropAllInChild() {
    for (const int fd : sockets_) {
        close(fd);
    }
    sockets_.clear();
    parents_.splice(parents_.end(), idle_);
}

std::unique_ptr<HttpConnection> ConnectionPool::take(const Endpoint &endpoint,
                                                     const TrustStore::Stamp &trust) {
    const std::string key = endpoint.key();
    const auto oldest = std::chrono::steady_clock::now() - kIdleTime;
    std::list<Idle> stale; // closed after the lock is released: closing calls closeSocket()
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    for (auto each = idle_.begin(); each != idle_.end();) {
        const auto next = std::next(each);
        if (each->since < oldest || each->trust != trust) {
            stale.splice(stale.end(), idle_, each);
        }
        each = next;
    }
    const auto found = std::find_if(idle_.rbegin(), idle_.rend(),
                                    [&key](const Idle &each) { return each.endpoint == key; });
    if (found == idle_.rend()) {
        return nullptr;
    }
    std::unique_ptr<HttpConnection> connection = std::move(found->connection);
    idle_.erase(std::next(found).base());
    return connection;
}

void ConnectionPool::keep(const Endpoint &endpoint, const TrustStore::Stamp &trust,
                          std::unique_ptr<HttpConnection> connection) {
    std::list<Idle> added;
    added.push_back(
        {endpoint.key(), trust, std::chrono::steady_clock::now(), std::move(connection)});
    const std::string &key = added.front().endpoint;
    std::list<Idle> surplus;
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    const auto same = [&key](const Idle &each) { return each.endpoint == key; };
    const auto count = std::count_if(idle_.begin(), idle_.end(), same);
    if (static_cast<std::size_t>(count) >= kMaxIdlePerEndpoint) {
        surplus.splice(surplus.end(), idle_, std::find_if(idle_.begin(), idle_.end(), same));
    } else if (idle_.size() >= kMaxIdle) {
        surplus.splice(surplus.end(), idle_, idle_.begin());
    }
    idle_.splice(idle_.end(), added);
}

int ConnectionPool::adopt(OvraBase::UniqueFd socket) {
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    sockets_.insert(socket.get());
    return socket.release();
}

void ConnectionPool::closeSocket(int fd) {
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    // One that is not listed is the parent's, and was closed when this child began.
    if (sockets_.erase(fd) == 1) {
        close(fd);
    }
}

} // namespace OvraPlatform
