// SPDX-License-Identifier: Apache-2.0
#include "nearest.h"

#include <algorithm>
#include <limits>

namespace Ovradr {

namespace {

constexpr std::size_t kLettersPerSlip = 3;

/// How many letters have to be put in, left out, changed, or exchanged with their neighbour (the
/// optimal string alignment distance).
std::size_t slips(const std::string &from, const std::string &to) {
    std::vector<std::size_t> beforeLast;
    std::vector<std::size_t> last;
    std::vector<std::size_t> row(to.size() + 1);
    for (std::size_t j = 0; j <= to.size(); ++j) {
        row[j] = j;
    }
    for (std::size_t i = 1; i <= from.size(); ++i) {
        beforeLast = last;
        last = row;
        row[0] = i;
        for (std::size_t j = 1; j <= to.size(); ++j) {
            row[j] = std::min(
                {last[j] + 1, row[j - 1] + 1, last[j - 1] + (from[i - 1] == to[j - 1] ? 0 : 1)});
            if (i > 1 && j > 1 && from[i - 1] == to[j - 2] && from[i - 2] == to[j - 1]) {
                row[j] = std::min(row[j], beforeLast[j - 2] + 1);
            }
        }
    }
    return row.back();
}

} // namespace

std::string nearest(const std::string &word, const std::vector<std::string> &known) {
    std::string found;
    std::size_t least = std::numeric_limits<std::size_t>::max();
    for (const std::string &each : known) {
        const bool begins = !word.empty() && each.starts_with(word);
        const std::size_t count = begins ? 0 : slips(word, each);
        if (count < least && count <= std::max<std::size_t>(word.size() / kLettersPerSlip, 1)) {
            found = each;
            least = count;
        }
    }
    return found;
}

} // namespace Ovradr
