// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"

#include <json/value.h>

namespace OvraPlatform {

/// A log-in that the other end refused without a word about account, password or one-time code. The
/// node library reports it as a wrong password (501).
struct LoginRefusal {
    int code = 0;       ///< of the web API, e.g. 107: too many log-ins failed; 0: there was none
    Json::Value detail; ///< what came with it
};

/// How the last log-in of this thread was refused.
OVRAPLATFORM_EXPORT LoginRefusal lastLoginRefusal();

} // namespace OvraPlatform
