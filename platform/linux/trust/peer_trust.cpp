// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/peer_trust.h"

#include "http/web_call.h"

#include <ovrabase/encoding.h>
#include <ovradrcore/log.h>

#include <chrono>
#include <exception>

namespace OvraPlatform {

namespace {

constexpr long kMaxSeconds = 24L * 60 * 60;

PeerIdentity identityOverTls(const Endpoint &endpoint, Deadline deadline) {
    const auto connection = HttpConnection::open(endpoint, HttpConnection::Purpose::kObserve);
    if (!connection) {
        return {CredError::kOutOfMemory};
    }
    const CredError error = connection->connectOnly(endpoint.key(), deadline).error;
    const CertificateVerifier &verifier = connection->verifier();
    if (error != CredError::kNone || verifier.fingerprint().empty()) {
        return {error == CredError::kNone ? CredError::kCannotConnect : error};
    }
    const bool accepted = verifier.verdict() == CertificateVerifier::Verdict::kSystem;
    return {CredError::kNone, verifier.fingerprint(), accepted};
}

PeerIdentity identityOverHttp(const Endpoint &endpoint, Deadline deadline) {
    const FetchedKey fetched = fetchSealKey(endpoint, {deadline, false});
    if (fetched.error != CredError::kNone) {
        return {fetched.error};
    }
    return {CredError::kNone, fingerprintOf(fetched.key)};
}

PeerIdentity identify(const Endpoint &endpoint, Deadline deadline) {
    PeerIdentity identity = endpoint.isTls() ? identityOverTls(endpoint, deadline)
                                             : identityOverHttp(endpoint, deadline);
    if (identity.error == CredError::kNone) {
        identity.pinned = TrustStore().lookup(endpoint.key(), identity.fingerprint);
    }
    return identity;
}

} // namespace

PeerIdentity peerFingerprint(const std::string &protocol, const std::string &host, int port,
                             long seconds) {
    try {
        const auto endpoint = Endpoint::make(protocol, host, port);
        if (!endpoint || seconds < 1 || seconds > kMaxSeconds) {
            return {CredError::kBadArgument};
        }
        return identify(*endpoint,
                        std::chrono::steady_clock::now() + std::chrono::seconds(seconds));
    } catch (const std::exception &error) {
        OVRA_ERR("An endpoint could not be met: [%s]", error.what());
        return {CredError::kOutOfMemory};
    }
}

TrustVerdict expectFingerprint(const std::string &protocol, const std::string &host, int port,
                               const std::string &fingerprint) {
    try {
        const auto endpoint = Endpoint::make(protocol, host, port);
        if (!endpoint || !OvraBase::isFingerprint(fingerprint)) {
            return TrustVerdict::kUnavailable;
        }
        return TrustStore().pin(endpoint->key(), fingerprint);
    } catch (const std::exception &error) {
        OVRA_ERR("A fingerprint could not be kept: [%s]", error.what());
        return TrustVerdict::kUnavailable;
    }
}

} // namespace OvraPlatform
