// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

namespace Ovradr {

// Each adds a command to the family `cred`, like addCredCommands().
void addCredCreateCommand(CLI::App &family, Command &chosen);
void addCredSetCommand(CLI::App &family, Command &chosen);
void addCredDeleteCommand(CLI::App &family, Command &chosen);
void addCredReverseCommand(CLI::App &family, Command &chosen);
void addCredTestCommand(CLI::App &family, Command &chosen);

} // namespace Ovradr
