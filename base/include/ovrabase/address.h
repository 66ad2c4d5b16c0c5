// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <sys/socket.h>

#include <optional>
#include <string>
#include <string_view>

// Addresses and host names as text, each in canonical form.
namespace OvraBase {

/// A socket address of either family.
struct SocketAddress {
    sockaddr_storage storage{};
    socklen_t size = 0;

    const sockaddr *get() const { return reinterpret_cast<const sockaddr *>(&storage); }
    bool isIpv6() const { return storage.ss_family == AF_INET6; }
};

/// The socket address of a numeric IPv4 address (four decimal numbers) or IPv6 address, without
/// brackets or scope; std::nullopt for any other text.
std::optional<SocketAddress> parseAddress(const std::string &text, int port);
bool isNumericAddress(const std::string &text);

/// Whether it is in fe80::/10 (RFC 4291, 2.5.6): it is nobody's without the name of a link.
bool isIpv6LinkLocal(const std::string &text);

/// The canonical form of an IPv6 address (RFC 5952), with or without brackets; "" for any other
/// text. A link-local one may name its link: "fe80::1%eth0", or "fe80::1%25eth0" as in a URL (RFC
/// 6874).
std::string normalizeIpv6(std::string text);

/// The numeric text of a socket address, without port; an IPv4-mapped address as IPv4. "" for
/// another family, and for null.
std::string addressText(const sockaddr *address);

/// What counts as one client: an IPv4 address, or the /64 network of an IPv6 address, the least
/// that a subscriber gets (RFC 6177). Any other text is returned unchanged.
/// \param address  numeric, as addressText() gives it
std::string clientKey(const std::string &address);

/// Whether the text can be a host name: 1 to 253 ASCII letters, digits, '-', '.' and '_' (RFC 1035,
/// 2.3.4, as text), with no leading dot or hyphen.
bool isHostName(std::string_view text);

/// "host:port", with an IPv6 address in brackets.
std::string joinHostPort(const std::string &host, int port);

/// The text without the white space around it.
std::string trimmed(std::string_view text);

/// The text with its ASCII letters in lower case.
std::string toLower(std::string_view text);

} // namespace OvraBase
