// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/utf8.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <iterator>

namespace OvraBase {

namespace {

struct LeadByte {
    std::size_t size; ///< of the whole character; 0: no character starts like this
    char32_t bits;
    char32_t least; ///< the lowest code that needs this size
};

LeadByte leadOf(unsigned char byte) {
    if (byte < 0x80U) {
        return {1, byte, 0};
    }
    if (byte >= 0xC0U && byte < 0xE0U) {
        return {2, byte & 0x1FU, 0x80};
    }
    if (byte >= 0xE0U && byte < 0xF0U) {
        return {3, byte & 0x0FU, 0x800};
    }
    if (byte >= 0xF0U && byte < 0xF8U) {
        return {4, byte & 0x07U, 0x10000};
    }
    return {0, 0, 0};
}

struct Range {
    char32_t first;
    char32_t last;
};

/// General categories Cc, Cf, Zl and Zp of Unicode 15 (UnicodeData.txt), in ascending order.
constexpr Range kHidden[] = {
    {0x00, 0x1F},       {0x7F, 0x9F},       {0xAD, 0xAD},       {0x600, 0x605},
    {0x61C, 0x61C},     {0x6DD, 0x6DD},     {0x70F, 0x70F},     {0x890, 0x891},
    {0x8E2, 0x8E2},     {0x180E, 0x180E},   {0x200B, 0x200F},   {0x2028, 0x202E},
    {0x2060, 0x206F},   {0xFEFF, 0xFEFF},   {0xFFF9, 0xFFFB},   {0x110BD, 0x110BD},
    {0x110CD, 0x110CD}, {0x13430, 0x1343F}, {0x1BCA0, 0x1BCA3}, {0x1D173, 0x1D17A},
    {0xE0000, 0xE007F},
};

bool isHidden(char32_t code) {
    const Range *const range =
        std::find_if(std::begin(kHidden), std::end(kHidden),
                     [code](const Range &each) { return code <= each.last; });
    return range != std::end(kHidden) && code >= range->first;
}

} // namespace

Utf8Character firstUtf8(std::string_view text) {
    const LeadByte lead = text.empty() ? LeadByte{} : leadOf(static_cast<unsigned char>(text[0]));
    if (lead.size > text.size()) {
        return {};
    }
    char32_t code = lead.bits;
    for (std::size_t i = 1; i < lead.size; ++i) {
        const auto byte = static_cast<unsigned char>(text[i]);
        if ((byte & 0xC0U) != 0x80U) {
            return {};
        }
        code = (code << 6U) | (byte & 0x3FU);
    }
    const bool surrogate = code >= 0xD800 && code <= 0xDFFF;
    if (code < lead.least || surrogate || code > 0x10FFFF) {
        return {};
    }
    return {lead.size, code};
}

bool isUtf8(std::string_view text) {
    while (!text.empty()) {
        const std::size_t size = firstUtf8(text).size;
        if (size == 0) {
            return false;
        }
        text.remove_prefix(size);
    }
    return true;
}

std::string shown(std::string_view text, const Utf8Character &character) {
    constexpr std::string_view kMeanings = "\n\r\t";
    constexpr std::string_view kLetters = "nrt";
    const char first = text.front();
    const std::size_t at = kMeanings.find(first);
    if (at != std::string_view::npos) {
        return {'\\', kLetters[at]};
    }
    if (character.size > 0 && !isHidden(character.code)) {
        return std::string(text.substr(0, character.size));
    }
    std::array<char, 12> hex{};
    const bool wide = character.size > 1;
    std::snprintf(hex.data(), hex.size(), wide ? "\\u%04x" : "\\x%02x",
                  wide ? static_cast<unsigned int>(character.code)
                       : static_cast<unsigned int>(static_cast<unsigned char>(first)));
    return hex.data();
}

std::string shown(std::string_view text) {
    std::string line;
    while (!text.empty()) {
        const Utf8Character character = firstUtf8(text);
        line += shown(text, character);
        text.remove_prefix(std::max<std::size_t>(character.size, 1));
    }
    return line;
}

} // namespace OvraBase
