// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <json/value.h>

#include <string>

namespace OvraPlatform {

/// The call and its parameters.
struct APICall {
    std::string api;
    int version = 0;
    std::string method;
    Json::Value params{Json::objectValue}; ///< an object; a null counts as the empty one
};

/// A call from a process of this appliance, with the rights of `user`.
struct LocalCall : APICall {
    std::string user;
};

} // namespace OvraPlatform
