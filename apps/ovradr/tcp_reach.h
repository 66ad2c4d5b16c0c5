// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/conn.h>

#include <sys/socket.h>

#include <string>
#include <vector>

namespace Ovradr {

struct HostAddress {
    sockaddr_storage address{};
    socklen_t size = 0;
    std::string text; ///< as a number
};

/// The addresses of a host without duplicates. Waits as long as the system's resolver does.
[[nodiscard]] Expected<std::vector<HostAddress>> resolveHost(const std::string &host, int port);

/// Opens a bare TCP connection to the first address that accepts one, and closes it; 10 seconds at
/// most for all.
/// \param conn  whose addresses they are, for the message
/// \return the address that was reached.
[[nodiscard]] Expected<std::string> connectAny(const std::vector<HostAddress> &addresses,
                                               const OvraDRNode::Conn &conn);

} // namespace Ovradr
