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
    /// \return std::nullopt if one of them is something else.
    [[nodiscard]] static std::optional<Endpoint> make(const std::string &protocol,
                                                      const std::string &host, int port);

    bool isTls() const { return protocol_ == "https"; }
    /// The host, in lower case, without brackets.
    const std::string &host() const { return host_; }
    int port() const { return port_; }
    bool isIpv6() const { return host_.find(':') != std::string::npos; }
    /// "https://host:5001": the same text for the same endpoint.
    std::string key() const;
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
