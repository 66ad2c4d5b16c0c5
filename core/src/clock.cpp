// SPDX-License-Identifier: Apache-2.0
#include "clock.h"

#include <atomic>
#include <chrono>

namespace OvraDRCore {

namespace {

std::atomic<ClockFunction> replacement{nullptr};

} // namespace

std::int64_t systemMilliseconds() {
    if (const ClockFunction clock = replacement.load(std::memory_order_relaxed)) {
        return clock();
    }
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::milliseconds>(now).count();
}

void setSystemClock(ClockFunction clock) {
    replacement.store(clock, std::memory_order_relaxed);
}

} // namespace OvraDRCore
