// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <host/key_value_file.h>

#include <string>

using OvraFuzz::require;
using OvraPlatform::KeyValueLine;

// The lines tile the text, and a replaced value changes nothing else. Parts of the input: key,
// value, text.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view input = OvraFuzz::textOf(data, size);
    const std::string_view key = OvraFuzz::takePart(input);
    const std::string_view value = OvraFuzz::takePart(input);

    std::size_t end = 0;
    for (const KeyValueLine &line : OvraPlatform::parseKeyValueLines(input)) {
        require(line.begin == end && line.end > line.begin, "lines follow each other");
        end = line.end;
    }
    require(end == input.size(), "lines cover the text");

    const std::string line = std::string(key) + "=\"" + std::string(value) + "\"\n";
    const auto lines = OvraPlatform::parseKeyValueLines(line);
    if (lines.size() != 1 || lines[0].key != key || key.empty() || lines[0].value != value) {
        return 0; // not a line that a program would write
    }
    const std::string replaced = OvraPlatform::replaceKeyValue(input, key, line);
    require(OvraPlatform::findKeyValue(replaced, key) == value, "what was set is read");
    require(OvraPlatform::replaceKeyValue(replaced, key, line) == replaced,
            "setting twice is once");
    require(replaced.size() <= input.size() + line.size() + 1, "nothing else is added");
    return 0;
}
