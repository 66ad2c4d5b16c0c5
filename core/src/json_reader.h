// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string_view>

namespace OvraDRCore {

/// Parses a JSON text of RFC 8259, and nothing else: see fromString(). Independent of the locale.
/// \return false, with `value` unspecified, if `text` is not one.
/// \throws std::exception  out of memory
bool readJson(std::string_view text, Json::Value &value);

} // namespace OvraDRCore
