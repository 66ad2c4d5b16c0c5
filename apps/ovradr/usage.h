// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <CLI/CLI.hpp>

#include <functional>
#include <string>

namespace Ovradr {

/// The command of a program or a family with that name; null if there is none.
const CLI::App *childOf(const CLI::App &family, const std::string &name);

/// Why a word is no command of the family: names it, the nearest one, and those that there are.
Refusal unknownCommand(const CLI::App &family, const std::string &word);

/// The command that parsing reached: the program itself, a family, or a command.
const CLI::App &reachedCommand(const CLI::App &app);

/// What is wrong with a command line that was refused, and what the command takes. Surplus
/// arguments and values are not repeated: they may be a misplaced password.
Refusal usageFailure(const CLI::App &app, const CLI::ParseError &error);

/// For options: takes the value without the white space around it.
void trims(CLI::Option &option);

/// For options: accepts the whole numbers in a range.
std::function<std::string(const std::string &)> wholeNumber(long least, long most);

} // namespace Ovradr
