// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"

#include <string>

namespace Ovradr {

/// What a person types for the command: "ovradr cred create".
std::string commandLine(const CLI::App &command);

/// The help of a program or command, of at most 80 columns.
std::string helpText(const CLI::App &command);
/// The same as an outcome.
Report helpOf(const CLI::App &command);

/// The version of the program.
Report versionReport();

/// Has the tree show its help in this form. Before commands are added.
void useHelp(CLI::App &app);

} // namespace Ovradr
