// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// Appends `value` as compact JSON text in ASCII: see toString(). Independent of the locale.
void writeJson(const Json::Value &value, std::string &text);

} // namespace OvraDRCore
