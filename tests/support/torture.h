// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <algorithm>
#include <cstdlib>

namespace OvraTest {

/// How much longer than in the daily run a test goes on: OVRA_TORTURE, or 1.
inline int tortureScale() {
    const char *const text = std::getenv("OVRA_TORTURE");
    return text != nullptr ? std::max(1, std::atoi(text)) : 1;
}

} // namespace OvraTest
