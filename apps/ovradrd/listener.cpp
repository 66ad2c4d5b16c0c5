// SPDX-License-Identifier: Apache-2.0
#include "listener.h"

#include <ovradrcore/log.h>

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <system_error>

namespace Ovradrd {

namespace {

using OvraPlatform::UniqueFd;

constexpr int kQueue = 1024;

union Address {
    sockaddr any;
    sockaddr_in ipv4;
    sockaddr_in6 ipv6;
};

struct Place {
    Address address{};
    socklen_t size = 0;
    bool everywhere = false;
};

Place ipv4Place(int port) {
    Place place;
    place.address.ipv4.sin_family = AF_INET;
    place.address.ipv4.sin_port = htons(static_cast<std::uint16_t>(port));
    place.size = sizeof(sockaddr_in);
    return place;
}

Place ipv6Place(int port) {
    Place place;
    place.address.ipv6.sin6_family = AF_INET6;
    place.address.ipv6.sin6_port = htons(static_cast<std::uint16_t>(port));
    place.size = sizeof(sockaddr_in6);
    return place;
}

/// A family of 0 when the text is no address.
Place placeOf(const std::string &text, int port) {
    Place place = ipv4Place(port);
    if (inet_pton(AF_INET, text.c_str(), &place.address.ipv4.sin_addr) == 1) {
        return place;
    }
    place = ipv6Place(port);
    if (inet_pton(AF_INET6, text.c_str(), &place.address.ipv6.sin6_addr) == 1) {
        return place;
    }
    return {};
}

bool setOption(int fd, int level, int option, int value) {
    return setsockopt(fd, level, option, &value, sizeof(value)) == 0;
}

bool bindTo(int fd, const Place &place) {
    return bind(fd, &place.address.any, place.size) == 0;
}

/// bind(2), also to an address that comes later.
bool bindPatiently(int fd, const Place &place, const std::string &name) {
    if (bindTo(fd, place)) {
        return true;
    }
    if (errno != EADDRNOTAVAIL) {
        return false;
    }
    OVRA_WARN("The machine does not have the address [%s] now; it is served as soon as it does",
              name.c_str());
    return setOption(fd, IPPROTO_IP, IP_FREEBIND, 1) && bindTo(fd, place);
}

int portOf(int fd) {
    Address address{};
    socklen_t size = sizeof(address);
    if (getsockname(fd, &address.any, &size) != 0) {
        return 0;
    }
    // The port stands at the same place in both families.
    return ntohs(address.ipv4.sin_port);
}

/// An open socket at the place; the descriptor is invalid, and errno says why, when it cannot be.
UniqueFd listenAt(const Place &place, const std::string &name) {
    UniqueFd fd(socket(place.address.any.sa_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const bool ipv6 = place.address.any.sa_family == AF_INET6;
    if (!fd || !setOption(fd.get(), SOL_SOCKET, SO_REUSEADDR, 1) ||
        (ipv6 && !setOption(fd.get(), IPPROTO_IPV6, IPV6_V6ONLY, place.everywhere ? 0 : 1)) ||
        !bindPatiently(fd.get(), place, name) || ::listen(fd.get(), kQueue) != 0) {
        return {};
    }
    return fd;
}

} // namespace

Listener Listener::listen(const std::string &address, int port) {
    Listener listener;
    Place place = address.empty() ? ipv6Place(port) : placeOf(address, port);
    place.everywhere = address.empty();
    listener.socket = listenAt(place, address);
    if (!listener.socket && place.everywhere && errno != EADDRINUSE) {
        // A kernel without IPv6.
        listener.socket = listenAt(ipv4Place(port), address);
    }
    if (listener.socket) {
        listener.port = portOf(listener.socket.get());
        return listener;
    }
    const int error = errno;
    const std::string where =
        "port " + std::to_string(port) + (address.empty() ? std::string() : " of " + address);
    if (error == EADDRINUSE) {
        listener.problem = Problem::kPortInUse;
        listener.why = where + " is in use by another program: stop that, or set another port in "
                               "the settings";
    } else {
        listener.problem = Problem::kOther;
        listener.why = "cannot listen on " + where + ": " + std::system_category().message(error) +
                       "; correct the settings";
    }
    return listener;
}

} // namespace Ovradrd
