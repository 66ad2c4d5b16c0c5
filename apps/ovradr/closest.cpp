// SPDX-License-Identifier: Apache-2.0
#include "closest.h"

#include <ovrabase/address.h>

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace Ovradr {

namespace {

using Row = std::vector<std::size_t>;

constexpr std::size_t kFewestTyped = 3;
constexpr std::size_t kMostTyped = 64;
constexpr std::size_t kMostMistakes = 2;
constexpr std::size_t kLettersForAMistake = 4;

/// How many mistakes turn the nearest beginning of `word` into `text`: the optimal string alignment
/// distance (Damerau, 1964), by rows of the letters typed.
/// \param whole  the whole word instead of its beginning
std::size_t mistakes(std::string_view text, std::string_view word, bool whole) {
    Row before(word.size() + 1);
    Row above(word.size() + 1);
    Row row(word.size() + 1);
    for (std::size_t j = 0; j <= word.size(); ++j) {
        row[j] = j;
    }
    for (std::size_t i = 1; i <= text.size(); ++i) {
        before.swap(above);
        above.swap(row);
        row[0] = i;
        for (std::size_t j = 1; j <= word.size(); ++j) {
            const bool same = text[i - 1] == word[j - 1];
            row[j] = std::min({above[j] + 1, row[j - 1] + 1, above[j - 1] + (same ? 0 : 1)});
            if (i > 1 && j > 1 && text[i - 1] == word[j - 2] && text[i - 2] == word[j - 1]) {
                row[j] = std::min(row[j], before[j - 2] + 1);
            }
        }
    }
    return whole ? row.back() : *std::min_element(row.begin(), row.end());
}

} // namespace

std::string closest(const std::string &text, const std::vector<std::string> &words) {
    const std::string typed = OvraBase::toLower(text);
    const std::size_t allowed = std::max<std::size_t>(typed.size() / kLettersForAMistake, 1);
    std::size_t least = std::min(kMostMistakes, allowed) + 1;
    std::string found;
    if (typed.size() > kMostTyped || typed.size() < kFewestTyped) {
        return found;
    }
    for (const std::string &word : words) {
        const std::string compared =
            OvraBase::toLower(word.substr(0, typed.size() + kMostMistakes));
        const std::size_t wrong = mistakes(typed, compared, word.size() <= compared.size());
        if (!word.empty() && wrong < least) {
            least = wrong;
            found = word;
        }
    }
    return found;
}

} // namespace Ovradr
