// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/peer_trust.h"

#include "http/web_call.h"

#include <ovradrcore/log.h>

#include <chrono>
#include <exception>

namespace OvraPlatform {

namespace {

constexpr long kMaxSeconds = 24L * 60 * 60;

CredExpected<PeerIdentity> identityOverTls(const Endpoint &endpoint, Deadline deadline) {
    const auto connection = HttpConnection::open(endpoint, HttpConnection::Purpose::kObserve);
    if (!connection) {
        return tl::unexpected(CredError::kOutOfMemory);
    }
    if (const auto met = connection->connectOnly(endpoint.key(), deadline); !met) {
        return tl::unexpected(met.error());
    }
    const CertificateVerifier &verifier = connection->verifier();
    if (verifier.fingerprint().empty()) {
        return tl::unexpected(CredError::kCannotConnect);
    }
    return PeerIdentity{verifier.fingerprint(), verifier.isAcceptedBySystem()};
}

CredExpected<PeerIdentity> identityOverHttp(const Endpoint &endpoint, Deadline deadline) {
    return fetchSealKey(endpoint, {deadline, false}).map([](const PublicKey &key) {
        return PeerIdentity{fingerprintOf(key)};
    });
}

CredExpected<PeerIdentity> identify(const Endpoint &endpoint, Deadline deadline) {
    auto identity = endpoint.isTls() ? identityOverTls(endpoint, deadline)
                                     : identityOverHttp(endpoint, deadline);
    if (identity) {
        identity->pinned = TrustStore().lookup(endpoint.trustKey(), identity->fingerprint);
    }
    return identity;
}

} // namespace

std::string trustKey(const std::string &protocol, const std::string &host, int port) {
    try {
        const auto endpoint = Endpoint::of(protocol, host, port);
        return endpoint ? endpoint->trustKey() : "";
    } catch (const std::exception &) {
        return {};
    }
}

CredExpected<PeerIdentity> peerFingerprint(const std::string &protocol, const std::string &host,
                                           int port, long seconds) {
    try {
        const auto endpoint = Endpoint::of(protocol, host, port);
        if (!endpoint || seconds < 1 || seconds > kMaxSeconds) {
            return tl::unexpected(CredError::kBadArgument);
        }
        return identify(*endpoint,
                        std::chrono::steady_clock::now() + std::chrono::seconds(seconds));
    } catch (const std::exception &error) {
        OVRA_ERR("An endpoint could not be met: [%s]", error.what());
        return tl::unexpected(CredError::kOutOfMemory);
    }
}

TrustVerdict trustEndpoint(const std::string &protocol, const std::string &host, int port,
                           const std::string &value, bool replace) {
    try {
        return TrustStore().trust(trustKey(protocol, host, port), value, replace);
    } catch (const std::exception &error) {
        OVRA_ERR("An endpoint could not be trusted: [%s]", error.what());
        return TrustVerdict::kUnavailable;
    }
}

} // namespace OvraPlatform
