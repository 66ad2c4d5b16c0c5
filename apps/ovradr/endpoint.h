// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrnode/conn.h>

#include <string>

namespace Ovradr {

/// The endpoint as the senders use it: for a relay endpoint the host name of its alias, any other
/// unchanged. Nobody is asked.
[[nodiscard]] Expected<OvraDRNode::Conn> directEndpoint(const OvraDRNode::Conn &conn);

/// Where to connect to: for a relay endpoint what the relay service names now, any other unchanged.
[[nodiscard]] Expected<OvraDRNode::Conn> placeOf(const OvraDRNode::Conn &conn);

/// Why a direct endpoint did not answer: looks again, for 9 seconds at most, and tells an unknown
/// name, a refused port, a lack of a route, silence, and a port that speaks something else apart.
Refusal whyNotReachable(const OvraDRNode::Conn &conn);

/// Probes a direct endpoint, at most 10 seconds and 9 more to learn why it does not answer. All
/// processes share the verdict, and nobody's earlier one is used.
/// \return success, or why it does not answer.
[[nodiscard]] Expected<void> probeEndpoint(const OvraDRNode::Conn &conn);

/// The key that this appliance shows at its own endpoint; "" if it cannot be read.
std::string ownFingerprint(const OvraDRNode::Conn &conn);

} // namespace Ovradr
