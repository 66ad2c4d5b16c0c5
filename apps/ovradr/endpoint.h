// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/conn.h>

#include <string>

namespace Ovradr {

/// The endpoint at which to connect: a relay endpoint as the relay service knows it now, any other
/// as it is.
[[nodiscard]] Expected<OvraDRNode::Conn> directEndpoint(const OvraDRNode::Conn &conn);

/// Probes a direct endpoint, at most 10 seconds and, to learn why it does not answer, 5 more. All
/// processes get to know the verdict.
/// \return why it does not answer; nothing when it does.
[[nodiscard]] Expected<void> probeEndpoint(const OvraDRNode::Conn &conn);

/// The key that this appliance shows at an endpoint of its own; "" where it cannot be read.
std::string ownFingerprint(const OvraDRNode::Conn &conn);

} // namespace Ovradr
