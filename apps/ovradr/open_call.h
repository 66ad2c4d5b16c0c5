// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovradrcore/response.h>
#include <ovradrnode/conn.h>

#include <json/value.h>

namespace Ovradr {

/// A call to an appliance that needs no session.
struct OpenCall {
    const char *api;
    int version;
    const char *method;
    Json::Value params;
    bool secret = false; ///< the parameters are login material: they are sealed
};

/// Makes the call; waits 10 seconds at most.
/// \param conn  a direct endpoint whose key is trusted
/// \return the answer, a refusal too, or why there is none.
[[nodiscard]] Expected<OvraDRCore::Response> callOpen(const OvraDRNode::Conn &conn,
                                                      const OpenCall &call);

/// By how many seconds the clock of the appliance is ahead of this one.
/// \param conn  as for callOpen()
[[nodiscard]] Expected<double> clockAhead(const OvraDRNode::Conn &conn);

/// "12.3 s behind this one".
std::string clockText(double ahead);

/// Says about a one-time code that is wrong how far the clocks are apart, if the other end tells
/// its time; any other failure is returned as it is.
/// \param conn  where the log-in was, also a relay endpoint
Refusal withClock(Refusal failed, const OvraDRNode::Conn &conn);

} // namespace Ovradr
