// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/json.h"

#include <json/value.h>

#include <string_view>

namespace OvraDRCore {

/// Parses a JSON text of RFC 8259, and nothing else: see parseJson(). Independent of the locale.
/// \param limits  what is used of them is taken off
/// \return the fault, with `value` unspecified, if `text` is none or exceeds a limit.
/// \throws std::exception  out of memory
JsonFault readJson(std::string_view text, JsonLimits &limits, Json::Value &value);

} // namespace OvraDRCore
