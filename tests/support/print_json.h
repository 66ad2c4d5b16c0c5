// SPDX-License-Identifier: Apache-2.0
#pragma once

// Included before every source of a test program.

#if __has_include(<json/json.h>)
#include <json/json.h>

#include <ostream>

namespace Json {

/// Prints a value in a failure as one line of JSON; by default gtest prints its bytes.
inline void PrintTo(const Value &value, std::ostream *out) {
    StreamWriterBuilder oneLine;
    oneLine["indentation"] = "";
    *out << writeString(oneLine, value);
}

} // namespace Json
#endif
