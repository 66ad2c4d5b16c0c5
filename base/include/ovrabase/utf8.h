// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace OvraBase {

/// One character of a text in UTF-8.
struct Utf8Character {
    std::size_t size = 0; ///< in bytes; 0 if there is no well-formed character
    char32_t code = 0;
};

/// The character at the start of `text`. As RFC 3629 has it: the shortest form only, no surrogate,
/// nothing over U+10FFFF.
Utf8Character firstUtf8(std::string_view text);

/// Whether `text` consists of such characters.
bool isUtf8(std::string_view text);

/// Foreign text as a terminal or a log line may show it, one line whatever it holds. Escaped are
/// bytes that are not UTF-8, control characters (C0, DEL, C1), line separators, and all format
/// characters (Unicode 15, general category Cf): those turn the direction of writing, or are there
/// and do not show.
std::string shown(std::string_view text);
/// The same of the first character of `text`. \param character  of firstUtf8(text)
std::string shown(std::string_view text, const Utf8Character &character);

} // namespace OvraBase
