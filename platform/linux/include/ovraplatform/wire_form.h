// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/api_call.h"
#include "ovraplatform/export.h"

#include <ovradrcore/json.h>

#include <tl/expected.hpp>

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

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

/// A request as it came: nothing of its parameters is parsed before the call is judged.
struct ReceivedCall : WireCall {
    std::vector<std::pair<std::string, std::string>>
        texts; ///< name and JSON text of each parameter
};

/// Reads a body. Refuses a body without api, version or method, a repeated field, parameters beside
/// a sealed envelope, and more than 1,000 fields.
/// \return the call, its parameters only as texts; the reason on failure, without any of the values
[[nodiscard]] OVRAPLATFORM_EXPORT tl::expected<ReceivedCall, std::string>
decodeForm(std::string_view body);

/// Parses the texts of the parameters into `params`, and wipes them.
/// \param limits  for all of them together in values and memory
[[nodiscard]] OVRAPLATFORM_EXPORT OvraDRCore::JsonFault
parseParams(ReceivedCall &call, const OvraDRCore::JsonLimits &limits = OvraDRCore::kRequestLimits);

} // namespace OvraPlatform
