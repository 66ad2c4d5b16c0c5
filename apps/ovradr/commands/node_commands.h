// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

namespace Ovradr {

// What commands/node.cpp adds to its family.
void addNodeNoteCommands(CLI::App &family, Command &chosen);

} // namespace Ovradr
