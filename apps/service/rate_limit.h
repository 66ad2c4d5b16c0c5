// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/address.h>

#include <chrono>
#include <cstddef>
#include <iterator>
#include <list>
#include <string>
#include <unordered_map>

namespace OvraService {

/// Limits the events of each client (see OvraBase::clientKey()) in a period. Remembers 8,192
/// clients; for one more it forgets the one whose period began first. Not thread-safe.
class RateLimit {
public:
    using TimePoint = std::chrono::steady_clock::time_point;

    RateLimit(std::size_t most, std::chrono::seconds period)
        : most_(most)
        , period_(period) {}

    /// Counts one event; false, without counting it, if there were too many.
    [[nodiscard]] bool allow(const std::string &address, TimePoint now) {
        const std::string client = OvraBase::clientKey(address);
        const auto found = byClient_.find(client);
        if (found != byClient_.end() && now - found->second->begin < period_) {
            return found->second->count < most_ && ++found->second->count > 0;
        }
        if (found != byClient_.end()) {
            forget(found->second);
        } else if (windows_.size() >= kMaxClients) {
            forget(windows_.begin());
        }
        windows_.push_back({client, now, 1});
        byClient_[client] = std::prev(windows_.end());
        return true;
    }

private:
    static constexpr std::size_t kMaxClients = 8192;
    struct Window {
        std::string client;
        TimePoint begin;
        std::size_t count = 0;
    };
    using Windows = std::list<Window>;

    void forget(Windows::iterator window) {
        byClient_.erase(window->client);
        windows_.erase(window);
    }

    std::size_t most_;
    std::chrono::seconds period_;
    Windows windows_; ///< in the order in which they began
    std::unordered_map<std::string, Windows::iterator> byClient_;
};

} // namespace OvraService
