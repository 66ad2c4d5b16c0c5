// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

namespace Ovradr {

/// The one of `words` that a person most likely meant by a mistyped `text`, which may also be the
/// beginning of a long one, in any case; "" if none is near, or fewer than three letters were
/// typed: a letter in four, at least one and two at most, may be wrong, left out, added, or swapped
/// with the next one.
std::string closest(const std::string &text, const std::vector<std::string> &words);

} // namespace Ovradr
