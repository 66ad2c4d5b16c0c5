// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovraplatform/cred_errors.h"

#include <ovrabase/connect.h>

#include <string>

namespace OvraPlatform {

/// Asks the relay service of this appliance where an alias is reached now; 10 seconds at most. The
/// answer says only where to connect to: whom to trust there is known by the alias.
/// \return kTimedOut, kOutOfMemory, or kCannotConnect for anything else; the log says why.
[[nodiscard]] CredExpected<Endpoint> findAlias(const std::string &alias,
                                               OvraBase::Deadline deadline);

} // namespace OvraPlatform
