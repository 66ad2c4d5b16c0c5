// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"
#include "failure.h"

namespace Ovradr {

/// Success if this user may use the files of the appliance, or if there are none yet; else one
/// sentence that names a file that he cannot read. Whoever looks past that takes what he cannot
/// read for missing.
[[nodiscard]] Expected<void> checkUser();

/// Whether this user is the superuser or owns the appliance's files: what he makes is of use to it.
[[nodiscard]] bool isOwnUser();

/// The command, refused where checkUser() fails.
Command forOwnUser(Command command);

} // namespace Ovradr
