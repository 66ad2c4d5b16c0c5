// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "prompt.h"

#include <CLI/CLI.hpp>

#include <functional>

namespace Ovradr {

/// The command from the command line, ready to run.
using Command = std::function<Outcome()>;

// Each adds a family of commands to the program. Parsing one of them sets `chosen`, which must
// outlive `app`.
void addHelpCommand(CLI::App &app, Command &chosen);
void addSetupCommand(CLI::App &app, Command &chosen);
void addNodeCommands(CLI::App &app, Command &chosen);
void addUserCommands(CLI::App &app, Command &chosen);
void addInviteCommand(CLI::App &app, Command &chosen);
void addPairCommand(CLI::App &app, Command &chosen);
void addCredCommands(CLI::App &app, Command &chosen);
void addSessionCommands(CLI::App &app, Command &chosen);
void addCallCommand(CLI::App &app, Command &chosen);
void addConnCommands(CLI::App &app, Command &chosen);
void addAttrCommands(CLI::App &app, Command &chosen);
void addWhyCommand(CLI::App &app, Command &chosen);
void addDoctorCommand(CLI::App &app, Command &chosen);
void addStatusCommand(CLI::App &app, Command &chosen);
void addSpeedCommand(CLI::App &app, Command &chosen);
void addFarlinkCommands(CLI::App &app, Command &chosen);

/// --password-file and --password-stdin; `source` must outlive `command`.
void addPasswordOptions(CLI::App &command, PasswordSource &source);

} // namespace Ovradr
