// SPDX-License-Identifier: Apache-2.0
#include "tcp_reach.h"

#include "target.h"

#include <ovrabase/connect.h>

#include <cerrno>

namespace Ovradr {

namespace {

OvraBase::Deadline deadline(std::chrono::seconds limit) {
    return std::chrono::steady_clock::now() + limit;
}

Refusal shortage(const std::string &what, int error) {
    return failure(ExitCode::kFailed, what + ": " + OvraBase::errnoText(error) + ".",
                   "Raise the limits of this machine, or end what takes them up.");
}

Refusal connectFailure(const std::string &where, int error) {
    if (OvraBase::isShortage(error)) {
        return shortage("No connection to " + where + " can be made here", error);
    }
    if (error == ECONNREFUSED) {
        return failure(ExitCode::kNotReachable, where + " refuses connections.",
                       "Check the port, and that ovradrd runs on that appliance.");
    }
    if (error == ETIMEDOUT) {
        return failure(ExitCode::kNotReachable, where + " does not answer at all.",
                       "Check that the appliance is on, the cables, and firewalls in between.");
    }
    return failure(ExitCode::kNotReachable,
                   where + " cannot be reached: " + OvraBase::errnoText(error) + ".",
                   "Check the address, the routes and the cables.");
}

} // namespace

Expected<std::vector<OvraBase::SocketAddress>> resolveHost(const std::string &host, int port,
                                                           std::chrono::seconds limit) {
    auto found = OvraBase::resolveHost(host, port, deadline(limit));
    if (!found && OvraBase::isShortage(found.error().number)) {
        return shortage("The host cannot be looked up here", found.error().number);
    }
    if (!found) {
        return failure(ExitCode::kNameUnknown,
                       found.error().number == ETIMEDOUT
                           ? "The name service does not say in time where " + host + " is."
                           : "The name " + host + " is not known: " + found.error().text + ".",
                       "Check how it is written, and the name service; or use its address.");
    }
    return std::move(*found);
}

Expected<std::string> connectAny(const std::vector<OvraBase::SocketAddress> &addresses,
                                 const OvraDRNode::Conn &conn, std::chrono::seconds limit) {
    const auto connected = OvraBase::connectFirst(addresses, deadline(limit));
    if (!connected) {
        return connectFailure(targetText(conn), connected.error().number);
    }
    return OvraBase::addressText(connected->peer.get()) + ", port " + std::to_string(conn.port);
}

} // namespace Ovradr
