// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

namespace Ovradr {

// Each adds a command to the family `session`, like addSessionCommands().
void addSessionAuditCommand(CLI::App &family, Command &chosen);
void addSessionPendingCommand(CLI::App &family, Command &chosen);

} // namespace Ovradr
