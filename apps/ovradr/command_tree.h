// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

#include <string_view>

namespace Ovradr {

inline constexpr std::string_view kJsonFlag = "--json";

/// Adds everything that the program understands: its commands with their options, arguments and
/// help. Lists of commands elsewhere are generated from this tree or compared with it.
/// \param json    set if the flag is given; must outlive `app`, as must `chosen`
/// \param chosen  receives the command found by parsing
void addCommandTree(CLI::App &app, bool &json, Command &chosen);

} // namespace Ovradr
