// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <sys/types.h>

#include <string>
#include <string_view>

namespace Ovradr {

/// What a step of the set-up did.
struct SetUpStep {
    std::string what;   ///< e.g. "node database"
    bool made = false;  ///< otherwise it was there, and stays as it was
    std::string detail; ///< where it is, and what else is worth knowing
};

/// Makes a file, whole and durable, unless it is there: an existing one is never replaced, also
/// when another process makes it at the same time. \return whether this call made it
Expected<bool> writeNewFile(const std::string &path, std::string_view content, mode_t mode);

/// Takes away what others may do with a file that is only ours.
/// \return whether they could do something
Expected<bool> makePrivate(const std::string &path);

/// The failure of an operation on a file of this appliance, with the reason that errno gives.
Failure fileFailure(const std::string &path, int error);

} // namespace Ovradr
