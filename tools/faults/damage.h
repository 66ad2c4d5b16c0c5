// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <algorithm>
#include <cstddef>
#include <random>
#include <string>
#include <string_view>

namespace OvraTest {

/// What a disk, an editor or a person may do to a file, once to three times.
inline std::string damage(std::string text, std::mt19937 &random) {
    const auto below = [&random](std::size_t bound) { return bound == 0 ? 0 : random() % bound; };
    for (std::size_t times = 1 + below(3); times > 0; --times) {
        std::size_t at = below(text.size());
        while (at < text.size() && text[at] == '\0' && below(64) != 0) {
            at = below(text.size()); // most bytes of a database are of no use
        }
        const std::size_t some = std::min(text.size() - at, std::size_t{1} << below(13));
        using namespace std::string_view_literals;
        constexpr std::string_view kLiked = "\0\xff\n\"'= #-/019azAZ\x80\x7f"sv;
        switch (below(9)) {
        case 0:
        case 1:
            text.empty() ? void() : void(text[at] = static_cast<char>(text[at] ^ (1 << below(8))));
            break;
        case 2:
            text.empty() ? void() : void(text[at] = kLiked[below(kLiked.size())]);
            break;
        case 3:
            text.insert(at, 1 + below(3), kLiked[below(kLiked.size())]);
            break;
        case 4:
            text.erase(at, below(2) == 0 ? 1 : some);
            break;
        case 5:
            text.resize(at);
            break;
        case 6:
            text.replace(at, some, some, '\0');
            break;
        case 7:
            text.insert(at, text.substr(below(text.size()), some));
            break;
        default:
            std::generate_n(text.begin() + static_cast<std::ptrdiff_t>(at), some,
                            [&random] { return static_cast<char>(random()); });
        }
    }
    return text;
}

} // namespace OvraTest
