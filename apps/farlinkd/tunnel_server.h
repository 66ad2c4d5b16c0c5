// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/listener.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

namespace Farlinkd {

/// Puts callers through to appliances that cannot be connected to.
///
/// Every alias has a port. A caller who connects there is kept waiting and announced; the appliance
/// then connects to the tunnel port, says in its first line which caller it means, and from there
/// on the bytes of both pass to and fro unread, until both ends have closed. One thread carries
/// them all, with a buffer of bounded size for each direction.
class TunnelServer {
public:
    struct Limits {
        std::size_t calls = 512; ///< callers in all, waiting or put through
        std::size_t perAlias = 64;
        std::size_t arriving = 128;               ///< appliances that have not said whom they mean
        std::chrono::milliseconds line{5'000};    ///< for saying it
        std::chrono::milliseconds answer{10'000}; ///< how long a caller waits for the appliance
        std::chrono::milliseconds idle{120'000};
    };
    /// Announces a caller, in the thread of the tunnel server; false when the appliance is not
    /// there.
    using Announce = std::function<bool(const std::string &alias, const std::string &caller)>;

    TunnelServer(Announce announce, const Limits &limits);
    TunnelServer(const TunnelServer &) = delete;
    TunnelServer &operator=(const TunnelServer &) = delete;
    /// Ends every call.
    ~TunnelServer();

    /// Begins.
    [[nodiscard]] OvraBase::Expected<void> start(OvraService::Listener tunnel);
    /// Takes callers of the alias at the socket from now on, instead of at an earlier one.
    void open(const std::string &alias, OvraService::Listener listener);
    /// Takes no more callers of the alias, and ends the calls under way.
    void close(const std::string &alias);

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace Farlinkd
