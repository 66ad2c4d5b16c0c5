// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace OvraPlatform {

/// The path of the web-API entry point.
inline constexpr char kEntryPoint[] = "webapi/query.cgi";

/// Where a request goes: a checked protocol, host and port.
class Endpoint {
public:
    /// \param protocol  "http" or "https"
    /// \param host      a host name in ASCII (letters, digits, '-', '.', '_') or an address, one of
    ///                  IPv6 with or without brackets
    /// \param port      1 to 65535
    /// \return std::nullopt if one of them is something else. A host name of an alias is HTTPS at
    ///         port 443, whatever port is given.
    [[nodiscard]] static std::optional<Endpoint> make(const std::string &protocol,
                                                      const std::string &host, int port);

    /// As make(), or for the protocol "flk" an appliance behind the relay.
    /// \param host  for "flk" its alias
    /// \param port  not used for "flk"
    [[nodiscard]] static std::optional<Endpoint> of(const std::string &protocol,
                                                    const std::string &host, int port);
    /// The host name of an alias, "nas3.farlink.alt": ours alone, since names under .alt are never
    /// in the DNS (RFC 9476). An endpoint with it is reached through the relay.
    static std::string hostOfAlias(const std::string &alias);

    bool isTls() const { return protocol_ == "https"; }
    /// The alias by which the relay knows the endpoint; "" if it is reached directly.
    std::string alias() const;
    /// The host, in lower case, without brackets.
    const std::string &host() const { return host_; }
    int port() const { return port_; }
    bool isIpv6() const { return host_.find(':') != std::string::npos; }
    /// "https://host:5001": the same text for the same endpoint.
    std::string key() const;
    /// The name under which its key is trusted: key(), or "flk:alias", whatever host and port the
    /// relay names for it.
    std::string trustKey() const;
    /// \param path  relative to the root
    /// \return std::nullopt if a character in it would not be part of a path.
    [[nodiscard]] std::optional<std::string> url(const std::string &path) const;

private:
    Endpoint() = default;

    std::string protocol_;
    std::string host_;
    int port_ = 0;
};

} // namespace OvraPlatform
