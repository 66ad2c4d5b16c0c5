// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/cred_errors.h"

#include <chrono>
#include <string>

namespace OvraPlatform {

/// Where an alias is reached now, over HTTPS.
struct AliasPlace {
    std::string host;
    int port = 0;
};

/// Asks the relay service of this appliance; 10 seconds at most.
/// \return kTimedOut, kOutOfMemory, or kCannotConnect for anything else; the log says why.
[[nodiscard]] CredExpected<AliasPlace> findAlias(const std::string &alias,
                                                 std::chrono::milliseconds time);

} // namespace OvraPlatform
