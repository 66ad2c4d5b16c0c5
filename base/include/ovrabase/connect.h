// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovrabase/address.h"
#include "ovrabase/expected.h"
#include "ovrabase/unique_fd.h"

#include <chrono>
#include <string>
#include <vector>

// TCP connections to hosts that may have several addresses.
namespace OvraBase {

using Deadline = std::chrono::steady_clock::time_point;

/// Whether an errno of the functions below says that descriptors, memory, threads or local ports
/// have run out here, which says nothing about the peer.
bool isShortage(int number);

/// The addresses of a host in the order of preference (RFC 6724). The system's resolver cannot be
/// interrupted: when time is up, it goes on in a thread of its own.
/// \return an error with an errno: ETIMEDOUT, or a shortage; or with 0 if the name is not known.
Expected<std::vector<SocketAddress>> resolveHost(const std::string &host, int port,
                                                 Deadline deadline);

struct Connection {
    UniqueFd socket; ///< not blocking, close-on-exec
    SocketAddress peer;
};

/// Connects to the address that accepts first. The next one is tried side by side after 250 ms, or
/// as soon as one has failed, the families in turn (RFC 8305, 4 and 5).
/// \return an error with an errno: ETIMEDOUT, a shortage, or that of the last attempt.
Expected<Connection> connectFirst(std::vector<SocketAddress> addresses, Deadline deadline);

} // namespace OvraBase
