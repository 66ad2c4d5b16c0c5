// SPDX-License-Identifier: Apache-2.0
#include "json_writer.h"

#include <ovrabase/utf8.h>

#include <array>
#include <charconv>
#include <cmath>
#include <string_view>
#include <utility>

namespace OvraDRCore {

namespace {

/// Room for every number: a double takes at most 24 characters.
constexpr std::size_t kNumberSize = 32;

template <typename Number>
std::string_view writeNumber(Number number, std::string &text) {
    std::array<char, kNumberSize> digits{};
    const auto written = std::to_chars(digits.data(), digits.data() + digits.size(), number);
    const auto size = static_cast<std::size_t>(written.ptr - digits.data());
    text.append(digits.data(), size);
    return std::string_view(text).substr(text.size() - size);
}

/// The shortest text that reads back as the same number, and as a real one.
void writeReal(double number, std::string &text) {
    if (!std::isfinite(number)) {
        text += "null"; // JSON has no such numbers
    } else if (writeNumber(number, text).find_first_of(".e") == std::string_view::npos) {
        text += ".0";
    }
}

void writeEscape(char32_t code, std::string &text) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    text += "\\u";
    for (const unsigned int shift : {12U, 8U, 4U, 0U}) {
        text += kDigits[(code >> shift) & 0x0FU];
    }
}

void writeCharacter(char32_t code, std::string &text) {
    constexpr std::string_view kMeanings = "\"\\\b\f\n\r\t";
    constexpr std::string_view kLetters = "\"\\bfnrt";
    constexpr char32_t kAsciiEnd = 0x7F; // DEL, which terminals obey
    const std::size_t at =
        code < kAsciiEnd ? kMeanings.find(static_cast<char>(code)) : std::string_view::npos;
    if (at != std::string_view::npos) {
        text += '\\';
        text += kLetters[at];
    } else if (code >= 0x20 && code < kAsciiEnd) {
        text += static_cast<char>(code);
    } else if (code < 0x10000) {
        writeEscape(code, text);
    } else {
        writeEscape(0xD800 + ((code - 0x10000) >> 10U), text);
        writeEscape(0xDC00 + ((code - 0x10000) & 0x3FFU), text);
    }
}

/// A byte that is not UTF-8 becomes U+FFFD: JSON cannot hold it.
void writeString(std::string_view string, std::string &text) {
    constexpr char32_t kReplacement = 0xFFFD;
    text += '"';
    while (!string.empty()) {
        const OvraBase::Utf8Character character = OvraBase::firstUtf8(string);
        writeCharacter(character.size == 0 ? kReplacement : character.code, text);
        string.remove_prefix(character.size == 0 ? 1 : character.size);
    }
    text += '"';
}

std::string_view viewOf(const Json::Value &string) {
    const char *begin = nullptr;
    const char *end = nullptr;
    const bool set = string.getString(&begin, &end);
    return set ? std::string_view(begin, static_cast<std::size_t>(end - begin)) : "";
}

} // namespace

void writeJson(const Json::Value &value, std::string &text) {
    const char *separator = "";
    switch (value.type()) {
    case Json::nullValue:
        text += "null";
        break;
    case Json::booleanValue:
        text += value.asBool() ? "true" : "false";
        break;
    case Json::intValue:
        writeNumber(value.asLargestInt(), text);
        break;
    case Json::uintValue:
        writeNumber(value.asLargestUInt(), text);
        break;
    case Json::realValue:
        writeReal(value.asDouble(), text);
        break;
    case Json::stringValue:
        writeString(viewOf(value), text);
        break;
    case Json::arrayValue:
        text += '[';
        for (const Json::Value &item : value) {
            text += std::exchange(separator, ",");
            writeJson(item, text);
        }
        text += ']';
        break;
    case Json::objectValue:
        text += '{';
        for (auto member = value.begin(); member != value.end(); ++member) {
            text += std::exchange(separator, ",");
            writeString(member.name(), text);
            text += ':';
            writeJson(*member, text);
        }
        text += '}';
        break;
    }
}

} // namespace OvraDRCore
