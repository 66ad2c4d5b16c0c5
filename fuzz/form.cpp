// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovraplatform/wire_form.h>

#include <optional>
#include <string>

using OvraFuzz::require;

// A body that is accepted can be written again and means the same.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const auto call = OvraPlatform::decodeForm(OvraFuzz::textOf(data, size));
    if (!call) {
        require(!call.error().empty(), "a refusal has a reason");
        return 0;
    }
    const std::optional<std::string> body = OvraPlatform::encodeForm(*call);
    require(body.has_value(), "what was read can be written");
    const auto again = OvraPlatform::decodeForm(*body);
    require(again.has_value(), "what was written can be read");
    require(again->api == call->api && again->method == call->method &&
                again->version == call->version && again->params == call->params &&
                again->sid == call->sid && again->sealed == call->sealed,
            "a call survives its form");
    return 0;
}
