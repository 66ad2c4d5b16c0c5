// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/listener.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

namespace Farlinkd {

/// Puts callers through to appliances that accept no incoming connections.
///
/// Every alias has a port. A caller that connects there waits and is announced; the appliance then
/// connects to the tunnel port and names the caller in its first line. From then on the bytes pass
/// both ways unread until both ends have closed. One thread carries all calls, with a bounded
/// buffer for each direction.
///
/// The places are shared out by client: none has more than its share, and when no place is left,
/// the client that has the most loses the one that has waited longest to a client that has fewer.
class TunnelServer {
public:
    struct Limits {
        std::size_t calls = 512; ///< all callers, waiting or put through
        std::size_t perAlias = 64;
        std::size_t arriving = 128; ///< appliances that have not named a caller
        /// One client (OvraBase::clientKey()) gets one place in this many, of each of the three.
        std::size_t clientsShare = 2;
        std::chrono::milliseconds line{5'000};    ///< for saying it
        std::chrono::milliseconds answer{10'000}; ///< how long a caller waits for the appliance
        std::chrono::milliseconds idle{120'000};
    };
    /// Announces a caller, in the tunnel server's thread; false if the appliance is not present.
    using Announce = std::function<bool(const std::string &alias, const std::string &caller,
                                        const std::string &client)>;

    TunnelServer(Announce announce, const Limits &limits);
    TunnelServer(const TunnelServer &) = delete;
    TunnelServer &operator=(const TunnelServer &) = delete;
    /// Ends every call.
    ~TunnelServer();

    /// Begins.
    [[nodiscard]] OvraBase::Expected<void> start(OvraService::Listener tunnel);
    /// Accepts callers of the alias on this socket from now on, instead of an earlier one.
    void open(const std::string &alias, OvraService::Listener listener);
    /// Accepts no more callers of the alias, and ends the calls in progress.
    void close(const std::string &alias);

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace Farlinkd
