// SPDX-License-Identifier: Apache-2.0
#include "http/endpoint.h"

#include "ovraplatform/farlink.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>

#include <algorithm>

namespace OvraPlatform {

namespace {

constexpr std::size_t kMaxPath = 1024;
constexpr char kRelayWord[] = "flk";
constexpr std::string_view kAliasSuffix = ".farlink.alt";
constexpr int kAliasPort = 443;

bool isAlphanumeric(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

/// The host in its canonical spelling, "" if it is not one. What is left out keeps control
/// characters, blanks, user parts, paths and escapes out of the URL.
std::string normalizeHost(const std::string &host) {
    std::string ipv6 = OvraBase::normalizeIpv6(host);
    if (!ipv6.empty()) {
        return ipv6;
    }
    return OvraBase::isHostName(host) ? OvraBase::toLower(host) : "";
}

} // namespace

std::optional<Endpoint> Endpoint::make(const std::string &protocol, const std::string &host,
                                       int port) {
    if ((protocol != "http" && protocol != "https") || port < 1 || port > OvraBase::kMaxPort) {
        return std::nullopt;
    }
    Endpoint endpoint;
    endpoint.protocol_ = protocol;
    endpoint.host_ = normalizeHost(host);
    endpoint.port_ = port;
    if (endpoint.host_.empty()) {
        return std::nullopt;
    }
    if (endpoint.host_.ends_with(kAliasSuffix)) {
        endpoint.port_ = kAliasPort;
        return endpoint.isTls() && isFarlinkAlias(endpoint.alias()) ? std::optional(endpoint)
                                                                    : std::nullopt;
    }
    return endpoint;
}

std::optional<Endpoint> Endpoint::of(const std::string &protocol, const std::string &host,
                                     int port) {
    return protocol == kRelayWord ? make("https", hostOfAlias(host), kAliasPort)
                                  : make(protocol, host, port);
}

std::string Endpoint::hostOfAlias(const std::string &alias) {
    return OvraBase::toLower(alias).append(kAliasSuffix);
}

std::string Endpoint::alias() const {
    return host_.ends_with(kAliasSuffix) ? host_.substr(0, host_.size() - kAliasSuffix.size()) : "";
}

std::string Endpoint::trustKey() const {
    const std::string name = alias();
    return name.empty() ? key() : std::string(kRelayWord) + ":" + name;
}

std::string Endpoint::key() const {
    return protocol_ + "://" + OvraBase::joinHostPort(host_, port_);
}

std::optional<std::string> Endpoint::url(const std::string &path) const {
    const bool clean = std::all_of(path.begin(), path.end(), [](char c) {
        return isAlphanumeric(c) || c == '-' || c == '.' || c == '_' || c == '/';
    });
    if (!clean || path.size() > kMaxPath) {
        return std::nullopt;
    }
    // The other end has no use for the name of a link here (RFC 6874, 1).
    return protocol_ + "://" + OvraBase::joinHostPort(host_.substr(0, host_.find('%')), port_) +
           (path.starts_with('/') ? "" : "/") + path;
}

} // namespace OvraPlatform
