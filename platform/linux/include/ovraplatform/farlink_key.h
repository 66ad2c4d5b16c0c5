// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"
#include "ovraplatform/export.h"

#include <ovrabase/secret.h>

#include <sodium.h>
#include <tl/expected.hpp>

#include <string>

namespace OvraPlatform {

/// The key by which the relay service knows whose an alias is: Ed25519 (RFC 8032).
class OVRAPLATFORM_EXPORT FarlinkKey {
public:
    /// Reads the key, and makes it when there is none. \return why not, in one sentence
    [[nodiscard]] static tl::expected<FarlinkKey, std::string>
    loadOrCreate(const std::string &path = kFarlinkKeyFile);

    /// The public key, base64url.
    std::string publicText() const;
    /// The signature of what enrols `alias` with the answer to `challenge`, base64url.
    std::string sign(const std::string &alias, const std::string &challenge) const;

private:
    FarlinkKey() = default;

    OvraBase::SecretBytes<crypto_sign_SECRETKEYBYTES> secret_;
};

/// Whether sign() of the key that belongs to `publicText` made the signature.
[[nodiscard]] OVRAPLATFORM_EXPORT bool verifyFarlink(const std::string &publicText,
                                                     const std::string &alias,
                                                     const std::string &challenge,
                                                     const std::string &signature);

} // namespace OvraPlatform
