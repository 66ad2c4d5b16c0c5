// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovrabase/address.h>
#include <ovradrnode/conn.h>

#include <string>
#include <vector>

namespace Ovradr {

/// The addresses of a host without duplicates; 10 seconds at most.
[[nodiscard]] Expected<std::vector<OvraBase::SocketAddress>> resolveHost(const std::string &host,
                                                                         int port);

/// Opens a bare TCP connection to the address that accepts one first, as requests do, and closes
/// it; 10 seconds at most for all.
/// \param conn  whose addresses they are, for the message
/// \return the address that was reached.
[[nodiscard]] Expected<std::string>
connectAny(const std::vector<OvraBase::SocketAddress> &addresses, const OvraDRNode::Conn &conn);

} // namespace Ovradr
