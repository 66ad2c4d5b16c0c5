// SPDX-License-Identifier: Apache-2.0
#include "target.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>
#include <ovraplatform/peer_trust.h>

#include <arpa/inet.h>

#include <optional>
#include <string_view>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;

Refusal refused(const std::string &text, const std::string &why) {
    return failure(ExitCode::kUsage, "\"" + text + "\" is not an endpoint: " + why + ".",
                   "Write https://HOST, https://HOST:PORT, http://HOST:PORT or flk:ALIAS.");
}

/// Takes the front of `text` if it is `prefix`, in any case.
bool consume(std::string_view &text, std::string_view prefix) {
    const bool matches = OvraBase::toLower(text.substr(0, prefix.size())) == prefix;
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
        const std::optional<int> given = OvraBase::parsePort(rest.substr(colon + 1));
        if (!given) {
            return refused(text, rest.find(':', colon + 1) == std::string_view::npos
                                     ? "its port is not a number from 1 to 65535"
                                     : "an IPv6 address needs brackets around it");
        }
        port = *given;
    }
    if (host.starts_with('[') && host.ends_with(']')) {
        host = OvraBase::normalizeIpv6(host);
        return host.empty() ? refused(text, "what stands in brackets is not an IPv6 address")
                            : Expected<Conn>(Conn(host, protocol, port));
    }
    in_addr address{};
    if (inet_aton(host.c_str(), &address) != 0 && !OvraBase::isNumericAddress(host)) {
        return refused(text, "an IPv4 address has four numbers, as 192.0.2.7");
    }
    if (!OvraBase::isHostName(host)) {
        return refused(text, host.empty() ? "it has no host" : "its host is not a valid name");
    }
    return Conn(OvraBase::toLower(host), protocol, port);
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
        return OvraBase::isHostName(rest) ? Expected<Conn>(Conn::farlink(std::string(rest)))
                                          : refused(text, "its alias is not a valid name");
    }
    return refused(text, "it does not begin with https://, http:// or flk:");
}

std::string targetText(const Conn &conn) {
    if (conn.isFarlink()) {
        return "flk:" + conn.addr;
    }
    const std::string known = OvraPlatform::trustKey(conn.protocol, conn.addr, conn.port);
    return known.starts_with("flk:")
               ? known
               : conn.protocol + "://" + OvraBase::joinHostPort(conn.addr, conn.port);
}

} // namespace Ovradr
