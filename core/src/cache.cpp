// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/cache.h"

#include "cache_file.h"
#include "clock.h"
#include "ovradrcore/json.h"
#include "ovradrcore/log.h"

#include <optional>

namespace OvraDRCore {

namespace {

/// A refresh probes at most a few endpoints, ten seconds each.
constexpr long kRefreshWait = 30;
constexpr std::int64_t kSecond = 1000;

struct Stored {
    Json::Value value;
    std::int64_t age = -1; ///< milliseconds; negative: stamped in the future
};

std::optional<Stored> load(const std::string &path, const std::string &name, int attempts) {
    const std::optional<CacheEntry> entry = CacheFile(path).read(name, attempts);
    Stored stored;
    if (!entry || !fromString(stored.value, entry->value)) {
        return std::nullopt;
    }
    stored.age = systemMilliseconds() - entry->end;
    return stored;
}

} // namespace

Cache::Cache(const std::string &path, const std::string &name, long lifetime, bool flag, int count)
    : path_(path)
    , name_(name)
    , lifetime_(lifetime)
    , flag_(flag)
    , count_(count) {}

Cache::~Cache() = default;

Json::Value Cache::GetDefaultValue() const {
    return {};
}

bool Cache::IsNeedUpdate(const Json::Value & /*value*/) const {
    return false;
}

bool Cache::IsUpdatedDataRequired() const {
    return flag_;
}

Json::Value Cache::Read() const {
    std::optional<Stored> stored;
    const auto isUsable = [&] {
        stored = load(path_, name_, count_);
        return stored && stored->age >= 0 && stored->age <= lifetime_ * kSecond &&
               IsValid(stored->value) && !IsNeedUpdate(stored->value);
    };
    const auto storedOrDefault = [&] {
        return stored && IsValid(stored->value) ? stored->value : GetDefaultValue();
    };
    if (isUsable()) {
        return stored->value;
    }
    RefreshLock lock(path_, name_);
    if (lock.isHeldHere()) {
        return storedOrDefault();
    }
    if (lock.isUsable()) {
        if (!lock.tryAcquire()) {
            const bool nothingStored = !stored || !IsValid(stored->value);
            if (!nothingStored && !IsUpdatedDataRequired()) {
                return stored->value;
            }
            if (!lock.acquire(kRefreshWait)) {
                OVRA_WARN("Waited too long for the refresh of cache entry [%s]", name_.c_str());
                return storedOrDefault();
            }
        }
        // The previous holder of the lock may have stored a fresh value.
        if (isUsable()) {
            return stored->value;
        }
    }
    Json::Value value;
    return refresh(value) ? value : storedOrDefault();
}

Json::Value Cache::GetCachedData() const {
    const std::optional<Stored> stored = load(path_, name_, count_);
    return stored ? stored->value : Json::Value();
}

double Cache::GetCachedAge() const {
    const std::optional<Stored> stored = load(path_, name_, count_);
    return stored && stored->age >= 0 ? static_cast<double>(stored->age) / kSecond : -1;
}

bool Cache::Update() const {
    // Concurrent readers share this refresh; one that another process began earlier may already be
    // out of date, so it is not waited for.
    RefreshLock lock(path_, name_);
    if (!lock.isHeldHere()) {
        lock.tryAcquire();
    }
    Json::Value value;
    return refresh(value);
}

bool Cache::refresh(Json::Value &value) const {
    if (!GetUpdatedData(value)) {
        return false;
    }
    // Without a usable directory this caller still gets the fresh value.
    UpdateWithData(value);
    return true;
}

bool Cache::UpdateWithData(const Json::Value &value) const {
    const std::int64_t now = systemMilliseconds();
    return CacheFile(path_).write({name_, toString(value), now, now, lifetime_ * kSecond}, now);
}

bool Cache::UpdateWithData(const Json::Value &value, long start, long end) const {
    const std::int64_t now = systemMilliseconds();
    // A measurement that ended in the current second ended now: rounding to seconds would shorten
    // its lifetime by up to one second.
    const std::int64_t ended = end == now / kSecond ? now : end * kSecond;
    return CacheFile(path_).write(
        {name_, toString(value), start * kSecond, ended, lifetime_ * kSecond}, now);
}

bool Cache::Remove() {
    return CacheFile(path_).remove(name_);
}

} // namespace OvraDRCore
