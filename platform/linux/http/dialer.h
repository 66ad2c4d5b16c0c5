// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovraplatform/cred_errors.h"

#include <ovrabase/connect.h>

namespace OvraPlatform {

/// A TCP connection to the endpoint, over whichever of its addresses accepts first. The one that
/// worked is tried first the next time, by every process of the appliance. For an alias the relay
/// is asked now where it is reached.
[[nodiscard]] CredExpected<OvraBase::UniqueFd> dial(const Endpoint &endpoint,
                                                    OvraBase::Deadline deadline);

} // namespace OvraPlatform
