// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/export.h"

#include <ovrabase/secret.h>

#include <sodium.h>
#include <tl/expected.hpp>

#include <string>

namespace OvraPlatform {

/// The key that identifies the owner of an alias to the relay service: Ed25519 (RFC 8032).
class OVRAPLATFORM_EXPORT FarlinkKey {
public:
    /// Reads the key; creates it if there is none. \return the reason on failure
    [[nodiscard]] static tl::expected<FarlinkKey, std::string>
    loadOrCreate(const std::string &path = kFarlinkKeyFile);

    /// The public key, base64url.
    std::string publicText() const;
    /// The signature that enrols `alias` in answer to `challenge`, base64url.
    std::string sign(const std::string &alias, const std::string &challenge) const;

private:
    FarlinkKey() = default;

    OvraBase::SecretBytes<crypto_sign_SECRETKEYBYTES> secret_;
};

/// Whether the signature is from sign() with the key that belongs to `publicText`.
[[nodiscard]] OVRAPLATFORM_EXPORT bool verifyFarlink(const std::string &publicText,
                                                     const std::string &alias,
                                                     const std::string &challenge,
                                                     const std::string &signature);

} // namespace OvraPlatform
