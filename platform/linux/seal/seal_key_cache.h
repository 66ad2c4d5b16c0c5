// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/sealed_box.h"
#include "ovraplatform/trust_store.h"

#include <ovradrcore/no_fork.h>

#include <chrono>
#include <cstddef>
#include <map>
#include <optional>
#include <string>

namespace OvraPlatform {

/// The sealing keys of endpoints that this process contacted lately. Thread-safe.
class SealKeyCache {
public:
    static constexpr std::size_t kMaxEndpoints = 64;
    static constexpr std::chrono::minutes kLifetime{5};

    struct Known {
        PublicKey key{};
        UnixMillis clockOffset = 0; ///< how far the endpoint's clock is ahead of ours
    };

    static SealKeyCache &instance();

    /// What is known of the endpoint and was learnt under the same trusted keys.
    std::optional<Known> find(const std::string &endpoint, const TrustStore::Stamp &trust);
    void put(const std::string &endpoint, const TrustStore::Stamp &trust, const Known &known);
    void drop(const std::string &endpoint);

private:
    struct Entry {
        Known known;
        TrustStore::Stamp trust;
        std::chrono::steady_clock::time_point since;
    };

    OvraDRCore::ForkSafeMutex mutex_;
    std::map<std::string, Entry> entries_;
};

} // namespace OvraPlatform
