// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <string>

namespace Ovradr {

/// The result of a set-up step.
struct SetUpStep {
    std::string what;   ///< e.g. "node database"
    bool made = false;  ///< otherwise it existed and is unchanged
    std::string detail; ///< its location and other details
};

/// Removes other users' permissions on a private file.
/// \return whether there were any
[[nodiscard]] Expected<bool> makePrivate(const std::string &path);

/// The failure of an operation on a file of this appliance, with the reason from errno.
Refusal fileFailure(const std::string &path, int error);

} // namespace Ovradr
