// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <cstring>
#include <optional>
#include <string>

namespace OvraPlatform {

/// The address of a Unix socket; std::nullopt if the path does not fit (unix(7): 107 bytes).
inline std::optional<sockaddr_un> localAddress(const std::string &path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof(address.sun_path)) {
        return std::nullopt;
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

/// connect(2); errno says why not.
inline bool connectLocal(int fd, const sockaddr_un &address) {
    return connect(fd, reinterpret_cast<const sockaddr *>(&address), sizeof(address)) == 0;
}

/// bind(2); errno says why not.
inline bool bindLocal(int fd, const sockaddr_un &address) {
    return bind(fd, reinterpret_cast<const sockaddr *>(&address), sizeof(address)) == 0;
}

} // namespace OvraPlatform
