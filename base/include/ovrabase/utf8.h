// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
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

} // namespace OvraBase
