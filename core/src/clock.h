// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstdint>

namespace OvraDRCore {

/// Milliseconds of the system clock since the epoch.
using ClockFunction = std::int64_t (*)();

std::int64_t systemMilliseconds();

/// Replaces the clock of this process; null restores the system clock. For tests, which cannot
/// wait.
void setSystemClock(ClockFunction clock);

} // namespace OvraDRCore
