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

/// One request as it travels. When `sealed` is set, parameters and session id are inside it and the
/// other two members are empty.
struct WireCall : APICall {
    std::string sid;    ///< the session id, or ""
    std::string sealed; ///< the sealed envelope, or ""
};

/// The body; nothing when a parameter has the name of a field of the form itself.
OVRAPLATFORM_EXPORT std::optional<std::string> encodeForm(const WireCall &call);

/// Reads a body. Refused are a body without api, version or method, a field that stands twice, a
/// parameter that is not JSON, parameters beside a sealed envelope, and more than 1,000 fields.
/// \return why not, in one sentence that repeats nothing of the values
[[nodiscard]] OVRAPLATFORM_EXPORT tl::expected<WireCall, std::string>
decodeForm(std::string_view body);

} // namespace OvraPlatform
