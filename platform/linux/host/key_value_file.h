// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraPlatform {

/// One line of a key-value file: key=value, or key="value". Blanks around key, sign and value do
/// not count. A line that starts with # is a comment; behind a value a # that follows a blank
/// starts one. Between double quotes every character but the quote stands for itself.
struct KeyValueLine {
    std::size_t begin = 0; ///< where the line starts in the text
    std::size_t end = 0;   ///< where the next line starts
    bool wellFormed = true;
    std::string key; ///< "" for an empty line, a comment and a line that is not well-formed
    std::string value;
};

/// The lines of `text`, all of them, in order.
std::vector<KeyValueLine> parseKeyValueLines(std::string_view text);

/// The value of `key`. Of several lines with the key the last one counts; one that is not
/// well-formed does not.
[[nodiscard]] std::optional<std::string> findKeyValue(std::string_view text, std::string_view key);

/// `text` with `line` (which ends in a newline) in place of the line that findKeyValue() takes, or
/// at the end if there is none. Every other line stays as it is, byte for byte.
std::string replaceKeyValue(std::string_view text, std::string_view key, std::string_view line);

} // namespace OvraPlatform
