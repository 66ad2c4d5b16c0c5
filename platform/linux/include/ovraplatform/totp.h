// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace OvraPlatform {

/// One-time codes: TOTP (RFC 6238) with SHA-1, steps of 30 seconds and 6 digits, which every
/// authenticator supports. A secret is written in base32 (RFC 4648), upper case, without padding.

/// A new secret of 160 random bits, the length that RFC 4226 (4, R6) recommends; "" if the kernel
/// gives no random numbers.
OVRAPLATFORM_EXPORT std::string newTotpSecret();

/// The canonical form of a secret that may have been typed in lower case or with blanks; "" if it
/// is not one (128 to 512 bits).
OVRAPLATFORM_EXPORT std::string normalizeTotpSecret(const std::string &secret);

/// The step whose code `code` is: one step before the step of `now`, that step, or the one after
/// it, and later than `after`. std::nullopt if there is none. The time taken does not reveal how
/// much of the code is right.
OVRAPLATFORM_EXPORT std::optional<std::int64_t> matchTotp(const std::string &secret,
                                                          std::string_view code, std::time_t now,
                                                          std::int64_t after = -1);

/// The URI that authenticators read at enrolment (otpauth://totp/...). It contains the secret.
/// \param issuer   the name under which the authenticator lists the appliance
OVRAPLATFORM_EXPORT std::string totpUri(const std::string &issuer, const std::string &account,
                                        const std::string &secret);

} // namespace OvraPlatform
