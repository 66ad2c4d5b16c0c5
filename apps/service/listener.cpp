// SPDX-License-Identifier: Apache-2.0
#include "service/listener.h"

#include <ovrabase/address.h>
#include <ovradrcore/log.h>

#include <netinet/in.h>

#include <cerrno>

namespace OvraService {

namespace {

using OvraBase::SocketAddress;
using OvraBase::UniqueFd;

constexpr int kBacklog = 1024;

bool setOption(int fd, int level, int option, int value) {
    return setsockopt(fd, level, option, &value, sizeof(value)) == 0;
}

/// bind(2), also to an address that comes later.
bool bindPatiently(int fd, const SocketAddress &place) {
    if (bind(fd, place.get(), place.size) == 0) {
        return true;
    }
    if (errno != EADDRNOTAVAIL) {
        return false;
    }
    OVRA_WARN("The machine does not have the address [%s] now; it is served as soon as it does",
              OvraBase::addressText(place.get()).c_str());
    return setOption(fd, IPPROTO_IP, IP_FREEBIND, 1) && bind(fd, place.get(), place.size) == 0;
}

int portOf(int fd) {
    SocketAddress address;
    address.size = sizeof(address.storage);
    if (getsockname(fd, reinterpret_cast<sockaddr *>(&address.storage), &address.size) != 0) {
        return 0;
    }
    // The port is at the same offset in both families.
    return ntohs(reinterpret_cast<const sockaddr_in *>(&address.storage)->sin_port);
}

/// An open socket on the address; on failure none, and errno says why.
/// \param bothFamilies  an IPv6 socket accepts IPv4 clients too
UniqueFd listenAt(const SocketAddress &place, bool bothFamilies) {
    UniqueFd fd(socket(place.storage.ss_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!fd || !setOption(fd.get(), SOL_SOCKET, SO_REUSEADDR, 1) ||
        (place.isIpv6() && !setOption(fd.get(), IPPROTO_IPV6, IPV6_V6ONLY, bothFamilies ? 0 : 1)) ||
        !bindPatiently(fd.get(), place) || ::listen(fd.get(), kBacklog) != 0) {
        return {};
    }
    return fd;
}

UniqueFd listenOn(const std::string &address, int port) {
    if (!address.empty()) {
        const auto place = OvraBase::parseAddress(address, port);
        errno = EINVAL;
        return place ? listenAt(*place, false) : UniqueFd();
    }
    UniqueFd fd = listenAt(*OvraBase::parseAddress("::", port), true);
    if (!fd && errno != EADDRINUSE) { // a kernel without IPv6
        fd = listenAt(*OvraBase::parseAddress("0.0.0.0", port), false);
    }
    return fd;
}

} // namespace

OvraBase::Expected<Listener> Listener::listen(const std::string &address, int port) {
    UniqueFd socket = listenOn(address, port);
    if (socket) {
        const int taken = portOf(socket.get());
        return Listener{std::move(socket), taken};
    }
    const int error = errno;
    const std::string where =
        "port " + std::to_string(port) + (address.empty() ? std::string() : " of " + address);
    if (error == EADDRINUSE) {
        return OvraBase::Unexpected({where + " is in use by another program: stop that, or set "
                                             "another port in the settings",
                                     error});
    }
    return OvraBase::Unexpected(
        {"cannot listen on " + where + ": " + OvraBase::errnoText(error) + "; correct the settings",
         error});
}

} // namespace OvraService
