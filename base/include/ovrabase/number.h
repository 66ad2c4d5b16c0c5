// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <charconv>
#include <limits>
#include <optional>
#include <string_view>
#include <system_error>

namespace OvraBase {

inline constexpr int kMaxPort = 65535;

/// The decimal number, from `min` to `max`, that `text` consists of; std::nullopt for any other
/// text.
template <typename T>
std::optional<T> parseNumber(std::string_view text, T min = std::numeric_limits<T>::min(),
                             T max = std::numeric_limits<T>::max()) {
    T number{};
    const char *const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    const bool whole = error == std::errc() && rest == end;
    return whole && number >= min && number <= max ? std::optional(number) : std::nullopt;
}

/// left - right, or the nearest number that the type has.
template <typename T>
T saturatingDifference(T left, T right) {
    T difference{};
    return !__builtin_sub_overflow(left, right, &difference) ? difference
           : right < 0                                       ? std::numeric_limits<T>::max()
                                                             : std::numeric_limits<T>::min();
}

/// A TCP port that can be connected to: 1 to 65535.
inline std::optional<int> parsePort(std::string_view text) {
    return parseNumber(text, 1, kMaxPort);
}

} // namespace OvraBase
