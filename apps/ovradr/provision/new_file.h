// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <string>

namespace Ovradr {

/// What a step of the set-up did.
struct SetUpStep {
    std::string what;   ///< e.g. "node database"
    bool made = false;  ///< otherwise it was there, and stays as it was
    std::string detail; ///< where it is, and what else is worth knowing
};

/// Takes away what others may do with a file that is only ours.
/// \return whether they could do something
[[nodiscard]] Expected<bool> makePrivate(const std::string &path);

/// The failure of an operation on a file of this appliance, with the reason that errno gives.
Refusal fileFailure(const std::string &path, int error);

} // namespace Ovradr
