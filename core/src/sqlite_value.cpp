// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/sqlite_value.h"

#include <array>
#include <charconv>

namespace OvraDRCore {

namespace {

std::string quoted(const std::string &text) {
    std::string literal = "'";
    for (const char c : text) {
        literal += c;
        if (c == '\'') {
            literal += '\'';
        }
    }
    return literal + "'";
}

/// SQL text ends at a NUL, so such a value is written as its bytes.
std::string quotedBytes(const std::string &text) {
    constexpr std::array<char, 17> kDigits = {"0123456789abcdef"};
    std::string literal = "CAST(x'";
    for (const char c : text) {
        const auto byte = static_cast<unsigned char>(c);
        literal += kDigits[byte >> 4];
        literal += kDigits[byte & 0x0F];
    }
    return literal + "' AS TEXT)";
}

} // namespace

bool SqliteValue::GetValue(std::string &text) const {
    const std::string *held = std::get_if<std::string>(&value_);
    if (held != nullptr) {
        text = *held;
    }
    return held != nullptr;
}

bool SqliteValue::GetValue(int &number) const {
    const int *held = std::get_if<int>(&value_);
    if (held != nullptr) {
        number = *held;
    }
    return held != nullptr;
}

std::string SqliteValue::ToLiteral() const {
    if (const int *number = std::get_if<int>(&value_)) {
        return std::to_string(*number);
    }
    const std::string *text = std::get_if<std::string>(&value_);
    if (text == nullptr) {
        return "NULL";
    }
    return text->find('\0') == std::string::npos ? quoted(*text) : quotedBytes(*text);
}

void SqliteValueList::AddValue(const std::string &name, const SqliteValue &value) {
    for (Column &column : columns_) {
        if (column.first == name) {
            column.second = value;
            return;
        }
    }
    columns_.emplace_back(name, value);
}

const SqliteValue *SqliteValueList::find(const std::string &name) const {
    for (const Column &column : columns_) {
        if (column.first == name) {
            return &column.second;
        }
    }
    return nullptr;
}

SqliteValue SqliteValueList::GetValue(const std::string &name) const {
    const SqliteValue *value = find(name);
    return value != nullptr ? *value : SqliteValue();
}

bool SqliteValueList::GetValue(const std::string &name, std::string &text) const {
    const SqliteValue *value = find(name);
    int number = 0;
    if (value != nullptr && value->GetValue(number)) {
        text = std::to_string(number);
        return true;
    }
    return value != nullptr && value->GetValue(text);
}

bool SqliteValueList::GetValue(const std::string &name, int &number) const {
    const SqliteValue *value = find(name);
    if (value == nullptr) {
        return false;
    }
    std::string text;
    if (!value->GetValue(text)) {
        return value->GetValue(number);
    }
    int parsed = 0;
    const char *end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, parsed);
    if (error != std::errc() || rest != end) {
        return false;
    }
    number = parsed;
    return true;
}

} // namespace OvraDRCore
