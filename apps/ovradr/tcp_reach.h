// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovrabase/address.h>
#include <ovradrnode/conn.h>

#include <chrono>
#include <string>
#include <vector>

namespace Ovradr {

/// How long a diagnosis waits for a name or a connection.
inline constexpr std::chrono::seconds kReachTime{10};

/// The addresses of a host without duplicates.
[[nodiscard]] Expected<std::vector<OvraBase::SocketAddress>>
resolveHost(const std::string &host, int port, std::chrono::seconds limit = kReachTime);

/// Opens a bare TCP connection to the address that accepts one first, as requests do, and closes
/// it.
/// \param conn   whose addresses they are, for the message
/// \param limit  for all of them
/// \return the address that was reached.
[[nodiscard]] Expected<std::string>
connectAny(const std::vector<OvraBase::SocketAddress> &addresses, const OvraDRNode::Conn &conn,
           std::chrono::seconds limit = kReachTime);

} // namespace Ovradr
