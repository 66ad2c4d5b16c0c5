// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

namespace Ovradr {

/// The one of `words` that a person most likely meant by a mistyped `text`, which may also be the
/// beginning of a long one, in any case; "" if none is near: a letter in four may be wrong, left
/// out, added, or swapped with the next one, and two at most.
std::string closest(const std::string &text, const std::vector<std::string> &words);

} // namespace Ovradr
