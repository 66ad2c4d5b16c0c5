// SPDX-License-Identifier: Apache-2.0
#include "seal/seal_key_cache.h"

#include <algorithm>
#include <mutex>

namespace OvraPlatform {

SealKeyCache &SealKeyCache::instance() {
    const OvraDRCore::NoFork noFork; // a child would wait for an initialisation under way
    static auto *cache = new SealKeyCache();
    return *cache;
}

std::optional<SealKeyCache::Known> SealKeyCache::find(const std::string &endpoint,
                                                      const TrustStore::Stamp &trust) {
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    const auto entry = entries_.find(endpoint);
    if (entry == entries_.end()) {
        return std::nullopt;
    }
    const auto age = std::chrono::steady_clock::now() - entry->second.since;
    if (entry->second.trust != trust || age > kLifetime) {
        entries_.erase(entry);
        return std::nullopt;
    }
    return entry->second.known;
}

void SealKeyCache::put(const std::string &endpoint, const TrustStore::Stamp &trust,
                       const Known &known) {
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    if (entries_.size() >= kMaxEndpoints && entries_.count(endpoint) == 0) {
        entries_.erase(
            std::min_element(entries_.begin(), entries_.end(), [](const auto &a, const auto &b) {
                return a.second.since < b.second.since;
            }));
    }
    entries_[endpoint] = {known, trust, std::chrono::steady_clock::now()};
}

void SealKeyCache::drop(const std::string &endpoint) {
    const std::lock_guard<OvraDRCore::ForkSafeMutex> lock(mutex_);
    entries_.erase(endpoint);
}

} // namespace OvraPlatform
