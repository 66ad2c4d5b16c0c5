// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovrabase/secret.h>

#include <string>

namespace Ovradr {

using OvraBase::Secret;

/// Where a password comes from. If neither is set, it is prompted for on the terminal.
struct PasswordSource {
    std::string file;
    bool fromStdin = false;
};

/// Whether a user can be prompted: standard input and standard error are a terminal.
bool isInteractive();

/// Gets a password: the first line of the file or of standard input, or what is typed in without
/// echo. An empty one, and one of more than Secret::kMaxSize bytes, is refused.
/// \param question  e.g. "Password of bob"
/// \param twice     a typed password must be typed again
[[nodiscard]] Expected<Secret> obtainPassword(const PasswordSource &source,
                                              const std::string &question, bool twice);

/// Asks for a secret on the terminal, without echo. Only where isInteractive().
[[nodiscard]] Expected<Secret> askSecret(const std::string &question);

/// Asks for a line on the terminal. Only where isInteractive().
[[nodiscard]] Expected<Secret> askLine(const std::string &question);

/// Asks a question on the terminal that only "y" or "yes" answers with true. Only where
/// isInteractive().
bool confirm(const std::string &question);

} // namespace Ovradr
