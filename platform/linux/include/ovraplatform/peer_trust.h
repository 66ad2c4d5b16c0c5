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
    /// What the pinned keys say about it.
    TrustVerdict pinned = TrustVerdict::kUnknown;
};

/// Contacts the endpoint to get its fingerprint before it is trusted. Sends nothing secret and pins
/// nothing. Over https it is the fingerprint of the certificate's key, over http that of the key to
/// which requests are sealed.
/// \param seconds  1 to 86,400
[[nodiscard]] OVRAPLATFORM_EXPORT CredExpected<PeerIdentity>
peerFingerprint(const std::string &protocol, const std::string &host, int port, long seconds);

/// Trusts the fingerprint for the endpoint from now on, before the first contact.
/// \return kTrusted; kDifferent if another one is pinned, which stays; kUnavailable if the
///         arguments are invalid or the file cannot be written
OVRAPLATFORM_EXPORT TrustVerdict expectFingerprint(const std::string &protocol,
                                                   const std::string &host, int port,
                                                   const std::string &fingerprint);

} // namespace OvraPlatform
