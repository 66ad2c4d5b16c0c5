// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>
#include <vector>

namespace Ovradr {

/// The one of `known` that a person who typed `word` probably meant: it begins with the word, or
/// one slip of the finger in three letters separates them. "" if there is none.
std::string nearest(const std::string &word, const std::vector<std::string> &known);

} // namespace Ovradr
