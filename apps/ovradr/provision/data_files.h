// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "provision/new_file.h"

#include <string>

namespace Ovradr {

/// Where the library runs the scripts.
inline constexpr char kScriptFolder[] = "/usr/ovra/ovradr/sbin";

/// Finds a file that was installed with the program: beside it (../share/ovradrnode), else at the
/// installed location.
[[nodiscard]] Expected<std::string> findDataFile(const std::string &name);

/// Links the scripts that measure the speed of a link to where the library looks for them, so that
/// they are updated with the program. Foreign files there stay.
[[nodiscard]] Expected<SetUpStep> provisionScripts();

} // namespace Ovradr
