// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/json.h>

#include <ostream>

namespace Json {

/// A value in a failure is one line of JSON; by itself gtest prints its bytes.
inline void PrintTo(const Value &value, std::ostream *out) {
    StreamWriterBuilder oneLine;
    oneLine["indentation"] = "";
    *out << writeString(oneLine, value);
}

} // namespace Json
