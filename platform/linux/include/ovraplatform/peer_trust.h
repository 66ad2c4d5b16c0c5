// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/cred_errors.h"
#include "ovraplatform/export.h"
#include "ovraplatform/trust_store.h"

#include <string>

namespace OvraPlatform {

/// The key that an endpoint shows now.
struct PeerIdentity {
    std::string fingerprint;       ///< "SHA256:...", as `ssh-keygen -l` shows keys
    bool acceptedBySystem = false; ///< the system's store accepts its certificate
    /// What the trusted keys say about it.
    TrustVerdict pinned = TrustVerdict::kUnknown;

    /// Whether requests are sent to it.
    bool isTrusted() const {
        const bool systemCounts =
            pinned == TrustVerdict::kUnknown || pinned == TrustVerdict::kVouched;
        return pinned == TrustVerdict::kTrusted || (systemCounts && acceptedBySystem);
    }
    /// Whether another key is trusted.
    bool isChanged() const {
        return pinned == TrustVerdict::kDifferent ||
               (pinned == TrustVerdict::kVouched && !acceptedBySystem);
    }
};

// An endpoint is given by protocol, host and port; one behind the relay by "flk", its alias and
// any port.

/// The name under which the key of an endpoint is trusted: "https://host:5001", or "flk:alias"; ""
/// if it is no endpoint.
OVRAPLATFORM_EXPORT std::string trustKey(const std::string &protocol, const std::string &host,
                                         int port);

/// Contacts the endpoint to get its fingerprint before it is trusted. Sends nothing secret and pins
/// nothing. Over https it is the fingerprint of the certificate's key, over http that of the key to
/// which requests are sealed.
/// \param seconds  1 to 86,400
[[nodiscard]] OVRAPLATFORM_EXPORT CredExpected<PeerIdentity>
peerFingerprint(const std::string &protocol, const std::string &host, int port, long seconds);

/// Trusts an endpoint from now on, as a person decided.
/// \param value    a fingerprint, or TrustStore::kSystem
/// \param replace  also in place of another pinned key
/// \return kTrusted; kDifferent if another one is pinned, which stays; kUnavailable if the
///         arguments are invalid or the file cannot be written
OVRAPLATFORM_EXPORT TrustVerdict trustEndpoint(const std::string &protocol, const std::string &host,
                                               int port, const std::string &value,
                                               bool replace = false);

} // namespace OvraPlatform
