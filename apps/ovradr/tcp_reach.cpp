// SPDX-License-Identifier: Apache-2.0
#include "tcp_reach.h"

#include "target.h"

#include <ovrabase/expected.h>
#include <ovrabase/unique_fd.h>

#include <netdb.h>
#include <poll.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <memory>

namespace Ovradr {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds kConnectTime{10};

/// 0, or the errno of the attempt.
int tryConnect(const HostAddress &address, Clock::time_point end) {
    const OvraBase::UniqueFd socketFd(
        socket(address.address.ss_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!socketFd) {
        return errno;
    }
    if (connect(socketFd.get(), reinterpret_cast<const sockaddr *>(&address.address),
                address.size) == 0) {
        return 0;
    }
    if (errno != EINPROGRESS) {
        return errno;
    }
    pollfd waiting{socketFd.get(), POLLOUT, 0};
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now()).count();
    if (poll(&waiting, 1, static_cast<int>(std::max<long>(left, 0))) != 1) {
        return ETIMEDOUT;
    }
    int error = 0;
    socklen_t size = sizeof error;
    return getsockopt(socketFd.get(), SOL_SOCKET, SO_ERROR, &error, &size) == 0 ? error : errno;
}

Refusal connectFailure(const std::string &where, int error) {
    if (error == ECONNREFUSED) {
        return failure(ExitCode::kNotReachable, where + " refuses connections.",
                       "Check the port, and that ovradrd runs over there.");
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

Expected<std::vector<HostAddress>> resolveHost(const std::string &host, int port) {
    addrinfo hints{};
    hints.ai_socktype = SOCK_STREAM;
    addrinfo *list = nullptr;
    const int error = getaddrinfo(host.c_str(), std::to_string(port).c_str(), &hints, &list);
    const std::unique_ptr<addrinfo, decltype(&freeaddrinfo)> owner(list, &freeaddrinfo);
    if (error != 0) {
        return failure(ExitCode::kNameUnknown,
                       "The host " + host + " is not known: " + gai_strerror(error) + ".",
                       "Check how it is written, and the name service; or use its address.");
    }
    std::vector<HostAddress> found;
    for (const addrinfo *entry = list; entry != nullptr; entry = entry->ai_next) {
        HostAddress address;
        std::array<char, NI_MAXHOST> text{};
        if (entry->ai_addrlen > sizeof address.address ||
            getnameinfo(entry->ai_addr, entry->ai_addrlen, text.data(), text.size(), nullptr, 0,
                        NI_NUMERICHOST) != 0) {
            continue;
        }
        std::memcpy(&address.address, entry->ai_addr, entry->ai_addrlen);
        address.size = entry->ai_addrlen;
        address.text = text.data();
        found.push_back(address);
    }
    return found;
}

Expected<std::string> connectAny(const std::vector<HostAddress> &addresses,
                                 const OvraDRNode::Conn &conn) {
    const auto end = Clock::now() + kConnectTime;
    int error = EADDRNOTAVAIL;
    for (const HostAddress &address : addresses) {
        error = tryConnect(address, end);
        if (error == 0) {
            return address.text + ", port " + std::to_string(conn.port);
        }
    }
    return connectFailure(targetText(conn), error);
}

} // namespace Ovradr
