// SPDX-License-Identifier: Apache-2.0
#include "rate.h"

#include <array>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <string_view>
#include <utility>

namespace Ovradr {

namespace {

constexpr double kBitsPerByte = 8;
constexpr std::array<std::pair<std::string_view, double>, 4> kPrefixes = {
    {{"", 1}, {"k", 1e3}, {"M", 1e6}, {"G", 1e9}}};

/// Three figures and the largest prefix that leaves at least one before the point.
std::string withPrefix(double value, const char *unit) {
    std::size_t prefix = kPrefixes.size() - 1;
    while (prefix > 0 && value < kPrefixes.at(prefix).second) {
        --prefix;
    }
    const double shown = value / kPrefixes.at(prefix).second;
    const int decimals = shown < 10 ? 2 : shown < 100 ? 1 : 0;
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.*f %s%s", decimals, shown,
                  kPrefixes.at(prefix).first.data(), unit);
    return text.data();
}

} // namespace

std::optional<double> bitsPerSecond(const std::string &speed) {
    double number = 0;
    const char *const end = speed.data() + speed.size();
    const auto [rest, error] = std::from_chars(speed.data(), end, number, std::chars_format::fixed);
    if (error != std::errc() || rest == end || *rest != ' ' || number < 0 ||
        !std::isfinite(number)) {
        return std::nullopt;
    }
    const std::string_view unit(rest + 1, static_cast<std::size_t>(end - rest - 1));
    for (const auto &[prefix, factor] : kPrefixes) {
        if (unit == std::string(prefix) + "bit/s") {
            return number * factor;
        }
        if (unit == std::string(prefix) + "B/s") {
            return number * factor * kBitsPerByte;
        }
    }
    return std::nullopt;
}

std::string rateText(const std::string &speed) {
    const auto bits = bitsPerSecond(speed);
    return bits ? withPrefix(*bits, "bit/s") + " (" + withPrefix(*bits / kBitsPerByte, "B/s") + ")"
                : speed;
}

} // namespace Ovradr
