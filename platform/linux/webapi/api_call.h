// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string>

namespace OvraPlatform {

/// What is called, and with which parameters.
struct APICall {
    std::string api;
    int version = 0;
    std::string method;
    Json::Value params{Json::objectValue}; ///< an object; a null counts as the empty one
};

} // namespace OvraPlatform
