// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <chrono>
#include <cstddef>
#include <string>
#include <unordered_map>

namespace OvraService {

/// Limits the events per address in a period. Not thread-safe.
class RateLimit {
public:
    using TimePoint = std::chrono::steady_clock::time_point;

    RateLimit(std::size_t most, std::chrono::seconds period)
        : most_(most)
        , period_(period) {}

    /// Counts one event; false, without counting it, if there were too many.
    [[nodiscard]] bool allow(const std::string &address, TimePoint now) {
        if (windows_.size() >= kMaxAddresses) {
            forgetOld(now);
        }
        Window &window = windows_[address];
        if (now - window.begin >= period_) {
            window = {now, 0};
        }
        return window.count < most_ && ++window.count > 0;
    }

private:
    static constexpr std::size_t kMaxAddresses = 8192;
    struct Window {
        TimePoint begin;
        std::size_t count = 0;
    };

    void forgetOld(TimePoint now) {
        std::erase_if(windows_,
                      [&](const auto &entry) { return now - entry.second.begin >= period_; });
        if (windows_.size() >= kMaxAddresses) {
            windows_.clear(); // rather than refuse every new one
        }
    }

    std::size_t most_;
    std::chrono::seconds period_;
    std::unordered_map<std::string, Window> windows_;
};

} // namespace OvraService
