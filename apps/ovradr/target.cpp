// SPDX-License-Identifier: Apache-2.0
#include "target.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>
#include <ovraplatform/peer_trust.h>

#include <arpa/inet.h>
#include <idn2.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;

constexpr const char *kForms =
    "Write https://HOST, https://HOST:PORT, http://HOST:PORT or flk:ALIAS.";

Refusal refused(const std::string &text, const std::string &why, const std::string &hint = kForms) {
    return failure(ExitCode::kUsage, "\"" + text + "\" is not an endpoint: " + why + ".", hint);
}

/// The name as the DNS has it, in ASCII (IDNA 2008 with the mapping of UTS 46); "" if there is
/// none.
std::string toAscii(const std::string &name) {
    std::uint8_t *ascii = nullptr;
    const int result = idn2_lookup_u8(reinterpret_cast<const std::uint8_t *>(name.c_str()), &ascii,
                                      IDN2_NFC_INPUT | IDN2_NONTRANSITIONAL);
    const std::unique_ptr<std::uint8_t, decltype(&idn2_free)> owner(ascii, &idn2_free);
    return result == IDN2_OK ? reinterpret_cast<const char *>(ascii) : "";
}

bool isAscii(const std::string &text) {
    return std::all_of(text.begin(), text.end(), [](char c) { return (c & 0x80) == 0; });
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
        if (host.empty()) {
            return refused(text, "what stands in brackets is not an IPv6 address");
        }
        if (OvraBase::isIpv6LinkLocal(host)) {
            return refused(text, "an address of fe80::/10 belongs to a link",
                           "Name the interface of this appliance: " + protocol + "://" +
                               OvraBase::joinHostPort(host + "%eth0", port) + ".");
        }
        return Conn(host, protocol, port);
    }
    if (!isAscii(host) && host.find('\0') == std::string::npos) {
        host = toAscii(host);
    }
    in_addr address{};
    if (inet_aton(host.c_str(), &address) != 0 && !OvraBase::isNumericAddress(host)) {
        return refused(text, "an IPv4 address has four numbers, as 192.0.2.7");
    }
    if (!OvraBase::isHostName(host)) {
        const bool none = rest.empty() || rest.starts_with(':');
        return refused(text, none ? "it has no host" : "its host is not a valid name");
    }
    return Conn(OvraBase::toLower(host), protocol, port);
}

} // namespace

Expected<Conn> parseTarget(const std::string &given) {
    const std::string text = OvraBase::trimmed(given);
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
    const std::string url = "https://" + text;
    const bool bare = parseAuthority(url, text, "https", kDefaultHttpsPort).has_value();
    return refused(text, "it does not begin with https://, http:// or flk:",
                   bare ? "Write " + url + ", or http:// for plain HTTP." : kForms);
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
