// SPDX-License-Identifier: Apache-2.0
#include "credential/endpoint.h"

#include <arpa/inet.h>
#include <netinet/in.h>

#include <algorithm>
#include <array>

namespace OvraPlatform {

namespace {

/// RFC 1035: 253 characters of text, 63 a label; the second limit is the resolver's to apply.
constexpr std::size_t kLongestName = 253;
constexpr std::size_t kLongestPath = 1024;
constexpr int kHighestPort = 65535;

bool isAlphanumeric(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

char toLower(char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

/// The one spelling of an IPv6 address, "" when it is none.
std::string normalIpv6(std::string text) {
    if (text.size() > 2 && text.front() == '[' && text.back() == ']') {
        text = text.substr(1, text.size() - 2);
    }
    in6_addr address{};
    std::array<char, INET6_ADDRSTRLEN> normal{};
    if (inet_pton(AF_INET6, text.c_str(), &address) != 1 ||
        inet_ntop(AF_INET6, &address, normal.data(), normal.size()) == nullptr) {
        return {};
    }
    return normal.data();
}

/// The name in lower case, "" when it is none. What it leaves out keeps control characters, blanks,
/// user parts, paths and escapes out of the URL.
std::string normalName(std::string name) {
    const bool clean = std::all_of(name.begin(), name.end(), [](char c) {
        return isAlphanumeric(c) || c == '-' || c == '.' || c == '_';
    });
    if (!clean || name.empty() || name.size() > kLongestName || name.front() == '.') {
        return {};
    }
    std::transform(name.begin(), name.end(), name.begin(), toLower);
    return name;
}

std::string normalHost(const std::string &host) {
    if (host.find('\0') != std::string::npos) {
        return {};
    }
    const std::string address = normalIpv6(host);
    return address.empty() ? normalName(host) : address;
}

} // namespace

std::optional<Endpoint> Endpoint::make(const std::string &protocol, const std::string &host,
                                       int port) {
    if ((protocol != "http" && protocol != "https") || port < 1 || port > kHighestPort) {
        return std::nullopt;
    }
    Endpoint endpoint;
    endpoint.protocol_ = protocol;
    endpoint.host_ = normalHost(host);
    endpoint.port_ = port;
    if (endpoint.host_.empty()) {
        return std::nullopt;
    }
    return endpoint;
}

std::string Endpoint::key() const {
    const std::string host = isIpv6() ? "[" + host_ + "]" : host_;
    return protocol_ + "://" + host + ":" + std::to_string(port_);
}

std::optional<std::string> Endpoint::url(const std::string &path) const {
    const bool clean = std::all_of(path.begin(), path.end(), [](char c) {
        return isAlphanumeric(c) || c == '-' || c == '.' || c == '_' || c == '/';
    });
    if (!clean || path.size() > kLongestPath) {
        return std::nullopt;
    }
    return key() + (path.starts_with('/') ? "" : "/") + path;
}

} // namespace OvraPlatform
