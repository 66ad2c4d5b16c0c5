// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/http_connection.h"
#include "ovraplatform/trust_store.h"

#include <ovrabase/unique_fd.h>
#include <ovradrcore/no_fork.h>

#include <chrono>
#include <cstddef>
#include <list>
#include <memory>
#include <set>
#include <string>
#include <vector>

namespace OvraPlatform {

/// The idle connections of this process, verified and ready for the next request to their endpoint.
///
/// Safe for threads. A forked child starts with none: it closes its copies of the sockets, so that
/// it neither uses nor ends the parent's TLS connections, and never touches their handles. A
/// connection is dropped after 30 idle seconds, or if the trusted keys have changed.
class ConnectionPool {
public:
    static constexpr std::size_t kMaxIdle = 32;
    static constexpr std::size_t kMaxIdlePerEndpoint = 4;
    static constexpr std::chrono::seconds kIdleTime{30};

    /// The pool of this process; it is never destroyed, because threads may outlive main().
    static ConnectionPool &instance();

    /// The most recently used connection, or null.
    [[nodiscard]] std::unique_ptr<HttpConnection> take(const Endpoint &endpoint,
                                                       const TrustStore::Stamp &trust);
    /// Keeps a connection on which a request has just ended well.
    /// \param trust  the stamp of the trusted keys from before that request
    void keep(const Endpoint &endpoint, const TrustStore::Stamp &trust,
              std::unique_ptr<HttpConnection> connection);

    /// Takes over a socket that a forked child shall close.
    int adopt(OvraBase::UniqueFd socket);
    void closeSocket(int fd);

private:
    struct Idle {
        std::string endpoint;
        TrustStore::Stamp trust;
        std::chrono::steady_clock::time_point since;
        std::unique_ptr<HttpConnection> connection;
    };

    ConnectionPool();
    void dropAllInChild();

    OvraDRCore::ForkSafeMutex mutex_;
    std::list<Idle> idle_; ///< the longest idle first
    std::set<int> sockets_;
    std::list<Idle> parents_; ///< a child's copies of its parent's, out of use
};

} // namespace OvraPlatform
