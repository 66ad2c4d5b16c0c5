// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/api_call.h"
#include "ovraplatform/export.h"

#include <tl/expected.hpp>

#include <optional>
#include <string>
#include <string_view>

// The body of a web-API request: application/x-www-form-urlencoded, as docs/wire.md describes it.
namespace OvraPlatform {

/// One request as sent. If `sealed` is set, parameters and session id are inside it and the other
/// two members are empty.
struct WireCall : APICall {
    std::string sid;    ///< the session id, or ""
    std::string sealed; ///< the sealed envelope, or ""
};

/// The body; std::nullopt if a parameter has the name of one of the form's own fields.
OVRAPLATFORM_EXPORT std::optional<std::string> encodeForm(const WireCall &call);

/// Reads a body. Refuses a body without api, version or method, a repeated field, a parameter that
/// is not JSON, parameters beside a sealed envelope, and more than 1,000 fields.
/// \return the reason on failure, without any of the values
[[nodiscard]] OVRAPLATFORM_EXPORT tl::expected<WireCall, std::string>
decodeForm(std::string_view body);

} // namespace OvraPlatform
