// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace OvraPlatform {

/// One-time codes: TOTP (RFC 6238) with SHA-1, 30 seconds a step and 6 digits, which is what every
/// authenticator can do. A secret is written in base32 (RFC 4648), upper case, without padding.

/// A new secret of 160 random bits, the length that RFC 4226 (4, R6) recommends; "" when the kernel
/// gives no random numbers.
OVRAPLATFORM_EXPORT std::string newTotpSecret();

/// The usual writing of a secret that a person may have typed in lower case or with blanks; "" when
/// it is not one (128 to 512 bits).
OVRAPLATFORM_EXPORT std::string normalizeTotpSecret(const std::string &secret);

/// The step whose code `code` is: one step before the step of `now`, that step, or the one after
/// it, and later than `after`. Nothing when there is none. The time that it takes does not tell how
/// much of the code is right.
OVRAPLATFORM_EXPORT std::optional<std::int64_t> matchTotp(const std::string &secret,
                                                          std::string_view code, std::time_t now,
                                                          std::int64_t after = -1);

/// The URI that authenticators read at enrolment (otpauth://totp/...). It holds the secret.
/// \param issuer   the name under which the authenticator lists the appliance
OVRAPLATFORM_EXPORT std::string totpUri(const std::string &issuer, const std::string &account,
                                        const std::string &secret);

} // namespace OvraPlatform
