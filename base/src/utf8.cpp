// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/utf8.h"

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

} // namespace OvraBase
