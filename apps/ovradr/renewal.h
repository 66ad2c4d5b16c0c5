// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <string>

namespace Ovradr {

/// The failure of a request over a credential. Where its session is lost, the hint is the command
/// that gets it another one: a further credential would leave this one behind, which is tried
/// before it.
Refusal credFailure(Refusal found, const std::string &credId);

/// The same for a request to a node, over whichever credential the answer came.
Refusal nodeFailure(Refusal found, const std::string &nodeId);

} // namespace Ovradr
