// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/address.h"

#include <arpa/inet.h>
#include <net/if.h>
#include <netinet/in.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>

namespace OvraBase {

namespace {

constexpr std::size_t kMaxHostName = 253;
constexpr std::size_t kNetworkBytes = 8;

bool isHostNameCharacter(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
           c == '.' || c == '_';
}

/// Whether it is "%" and what can be the name of an interface.
bool isLink(const std::string &text) {
    return text.size() > 1 && text.size() <= IF_NAMESIZE &&
           std::all_of(text.begin() + 1, text.end(), isHostNameCharacter);
}

/// inet_pton(3) would stop at the first NUL.
bool toBinary(int family, const std::string &text, void *binary) {
    return text.find('\0') == std::string::npos && inet_pton(family, text.c_str(), binary) == 1;
}

std::string toText(int family, const void *binary) {
    std::array<char, INET6_ADDRSTRLEN> text{};
    return inet_ntop(family, binary, text.data(), text.size()) == nullptr ? "" : text.data();
}

} // namespace

std::optional<SocketAddress> parseAddress(const std::string &text, int port) {
    SocketAddress address;
    sockaddr_in ipv4{};
    sockaddr_in6 ipv6{};
    if (toBinary(AF_INET, text, &ipv4.sin_addr)) {
        ipv4.sin_family = AF_INET;
        ipv4.sin_port = htons(static_cast<std::uint16_t>(port));
        address.size = sizeof(ipv4);
        std::memcpy(&address.storage, &ipv4, sizeof(ipv4));
        return address;
    }
    if (toBinary(AF_INET6, text, &ipv6.sin6_addr)) {
        ipv6.sin6_family = AF_INET6;
        ipv6.sin6_port = htons(static_cast<std::uint16_t>(port));
        address.size = sizeof(ipv6);
        std::memcpy(&address.storage, &ipv6, sizeof(ipv6));
        return address;
    }
    return std::nullopt;
}

bool isNumericAddress(const std::string &text) {
    return parseAddress(text, 0).has_value();
}

bool isIpv6LinkLocal(const std::string &text) {
    in6_addr binary{};
    return toBinary(AF_INET6, text, &binary) && IN6_IS_ADDR_LINKLOCAL(&binary);
}

std::string normalizeIpv6(std::string text) {
    if (text.size() > 2 && text.front() == '[' && text.back() == ']') {
        text = text.substr(1, text.size() - 2);
    }
    const std::size_t percent = std::min(text.find('%'), text.size());
    std::string link = text.substr(percent);
    text.resize(percent);
    if (link.starts_with("%25") && link.size() > 3) {
        link.erase(1, 2);
    }
    in6_addr binary{};
    if (!toBinary(AF_INET6, text, &binary) ||
        !(link.empty() || (IN6_IS_ADDR_LINKLOCAL(&binary) && isLink(link)))) {
        return "";
    }
    return toText(AF_INET6, &binary) + link;
}

std::string addressText(const sockaddr *address) {
    if (address != nullptr && address->sa_family == AF_INET) {
        return toText(AF_INET, &reinterpret_cast<const sockaddr_in *>(address)->sin_addr);
    }
    if (address == nullptr || address->sa_family != AF_INET6) {
        return {};
    }
    const in6_addr &ipv6 = reinterpret_cast<const sockaddr_in6 *>(address)->sin6_addr;
    return IN6_IS_ADDR_V4MAPPED(&ipv6) ? toText(AF_INET, &ipv6.s6_addr[12])
                                       : toText(AF_INET6, &ipv6);
}

std::string clientKey(const std::string &address) {
    in6_addr binary{};
    if (!toBinary(AF_INET6, address, &binary) || IN6_IS_ADDR_V4MAPPED(&binary)) {
        return address;
    }
    std::memset(binary.s6_addr + kNetworkBytes, 0, sizeof(binary.s6_addr) - kNetworkBytes);
    return toText(AF_INET6, &binary) + "/64";
}

bool isHostName(std::string_view text) {
    return !text.empty() && text.size() <= kMaxHostName && text.front() != '.' &&
           text.front() != '-' && std::all_of(text.begin(), text.end(), isHostNameCharacter);
}

std::string joinHostPort(const std::string &host, int port) {
    const bool ipv6 = host.find(':') != std::string::npos;
    return (ipv6 ? "[" + host + "]" : host) + ":" + std::to_string(port);
}

std::string trimmed(std::string_view text) {
    constexpr std::string_view kBlank = " \t\r\n\f\v";
    const std::size_t begin = std::min(text.find_first_not_of(kBlank), text.size());
    return std::string(text.substr(begin, text.find_last_not_of(kBlank) + 1 - begin));
}

std::string toLower(std::string_view text) {
    std::string lower(text);
    std::transform(lower.begin(), lower.end(), lower.begin(), [](char c) {
        return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
    });
    return lower;
}

} // namespace OvraBase
