// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "provision/new_file.h"

#include <string>

namespace Ovradr {

/// Finds a file that was installed with the program: beside it (../share/ovradrnode), else where it
/// was installed.
[[nodiscard]] Expected<std::string> findDataFile(const std::string &name);

/// Puts the scripts that measure the speed of a link where the library looks for them, as links to
/// the installed ones, so that they are renewed with the program. Files that somebody else has put
/// there stay.
[[nodiscard]] Expected<SetUpStep> provisionScripts();

} // namespace Ovradr
