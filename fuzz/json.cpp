// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovrabase/utf8.h>
#include <ovradrcore/json.h>

#include <json/value.h>

#include <string>

using OvraFuzz::require;

// A text that is accepted is UTF-8, and its value survives being written and read.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::string text(OvraFuzz::textOf(data, size));
    const Json::Value before("before");
    Json::Value value = before;
    if (!OvraDRCore::fromString(value, text)) {
        require(value == before, "a refused text leaves the value as it was");
        return 0;
    }
    require(OvraBase::isUtf8(text), "what is accepted is UTF-8");
    const std::string written = OvraDRCore::toString(value);
    Json::Value again;
    require(OvraDRCore::fromString(again, written), "what was written can be read");
    require(again == value, "a value survives being written and read");
    require(OvraDRCore::toString(again) == written, "a value has one text");
    Json::Value masked;
    require(OvraDRCore::fromString(masked, OvraDRCore::toLogString(value)), "a log text is JSON");
    return 0;
}
