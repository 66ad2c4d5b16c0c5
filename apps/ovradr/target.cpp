// SPDX-License-Identifier: Apache-2.0
#include "target.h"

#include <arpa/inet.h>
#include <netinet/in.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <optional>
#include <string_view>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;

constexpr std::size_t kLongestName = 253; // RFC 1035, 2.3.4, as text
constexpr int kHighestPort = 65535;

Failure refused(const std::string &text, const std::string &why) {
    return failure(ExitCode::kUsage, "\"" + text + "\" is not an endpoint: " + why + ".",
                   "Write https://HOST, https://HOST:PORT, http://HOST:PORT or flk:ALIAS.");
}

bool isName(std::string_view text) {
    return !text.empty() && text.size() <= kLongestName && text.front() != '.' &&
           text.front() != '-' && std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                      c == '-' || c == '.' || c == '_';
           });
}

/// The one spelling of an IPv6 address; "" when it is none.
std::string normalIpv6(const std::string &text) {
    in6_addr address{};
    std::array<char, INET6_ADDRSTRLEN> normal{};
    const bool valid = inet_pton(AF_INET6, text.c_str(), &address) == 1 &&
                       inet_ntop(AF_INET6, &address, normal.data(), normal.size()) != nullptr;
    return valid ? normal.data() : "";
}

char lower(char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

std::optional<int> parsePort(std::string_view text) {
    int port = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), port);
    const bool whole = error == std::errc() && end == text.data() + text.size();
    return whole && port >= 1 && port <= kHighestPort ? std::optional(port) : std::nullopt;
}

/// Takes the front of `text` if it is `prefix`, in any case.
bool consume(std::string_view &text, std::string_view prefix) {
    const bool matches =
        text.size() >= prefix.size() && std::equal(prefix.begin(), prefix.end(), text.begin(),
                                                   [](char a, char b) { return a == lower(b); });
    if (matches) {
        text.remove_prefix(prefix.size());
    }
    return matches;
}

Expected<Conn> parseAuthority(const std::string &text, std::string_view rest,
                              const std::string &protocol, int port) {
    if (rest.ends_with('/')) {
        rest.remove_suffix(1);
    }
    if (rest.find_first_of("/?#@\\") != std::string_view::npos) {
        return refused(text, "only a host and a port may stand in it");
    }
    const std::size_t bracket = rest.find(']');
    const std::size_t colon =
        rest.find(':', rest.starts_with('[') && bracket != std::string_view::npos ? bracket : 0);
    std::string host(rest.substr(0, colon));
    if (colon != std::string_view::npos) {
        const std::optional<int> given = parsePort(rest.substr(colon + 1));
        if (!given) {
            return refused(text, rest.find(':', colon + 1) == std::string_view::npos
                                     ? "its port is not a number from 1 to 65535"
                                     : "an IPv6 address needs brackets around it");
        }
        port = *given;
    }
    if (host.starts_with('[') && host.ends_with(']')) {
        host = normalIpv6(host.substr(1, host.size() - 2));
        return host.empty() ? refused(text, "what stands in brackets is not an IPv6 address")
                            : Expected<Conn>(Conn(host, protocol, port));
    }
    std::transform(host.begin(), host.end(), host.begin(), lower);
    if (!isName(host)) {
        return refused(text, host.empty() ? "it has no host" : "its host is not a valid name");
    }
    return Conn(host, protocol, port);
}

} // namespace

Expected<Conn> parseTarget(const std::string &text) {
    std::string_view rest = text;
    if (consume(rest, "https://")) {
        return parseAuthority(text, rest, "https", kDefaultHttpsPort);
    }
    if (consume(rest, "http://")) {
        return parseAuthority(text, rest, "http", kDefaultHttpPort);
    }
    if (consume(rest, "flk:")) {
        return isName(rest) ? Expected<Conn>(Conn::farlink(std::string(rest)))
                            : refused(text, "its alias is not a valid name");
    }
    return refused(text, "it does not begin with https://, http:// or flk:");
}

std::string targetText(const Conn &conn) {
    if (conn.isFarlink()) {
        return "flk:" + conn.addr;
    }
    const bool bracketed = conn.addr.find(':') != std::string::npos;
    return conn.protocol + "://" + (bracketed ? "[" + conn.addr + "]" : conn.addr) + ":" +
           std::to_string(conn.port);
}

} // namespace Ovradr
