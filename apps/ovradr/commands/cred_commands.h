// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "commands/commands.h"
#include "failure.h"
#include "node_ref.h"

namespace OvraDRNode {
class BaseSender;
} // namespace OvraDRNode

namespace Ovradr {

// Each adds a command to the family `cred`, like addCredCommands().
void addCredCreateCommand(CLI::App &family, Command &chosen);
void addCredSetCommand(CLI::App &family, Command &chosen);
void addCredDeleteCommand(CLI::App &family, Command &chosen);
void addCredReverseCommand(CLI::App &family, Command &chosen);
void addCredTestCommand(CLI::App &family, Command &chosen);

/// Whether the session of a credential is accepted at its endpoint, the node there is the right
/// one, and the right is there. \return the credential with its account
Outcome testCred(OvraDRNode::BaseSender &sender, const FoundCred &cred);

} // namespace Ovradr
