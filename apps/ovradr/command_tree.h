// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

#include <string_view>

namespace Ovradr {

inline constexpr std::string_view kJsonFlag = "--json";

/// Adds everything that the program understands: its commands with their options, arguments and
/// help. What lists commands elsewhere is made from this tree or compared with it.
/// \param json    set when the flag is given; has to live as long as `app`, as `chosen` has to
/// \param chosen  takes the command that parsing finds
void addCommandTree(CLI::App &app, bool &json, Command &chosen);

} // namespace Ovradr
