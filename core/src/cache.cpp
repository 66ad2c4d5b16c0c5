// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/cache.h"

#include "cache_file.h"
#include "clock.h"
#include "ovradrcore/json.h"
#include "ovradrcore/log.h"
#include "refresh_lock.h"

#include <ovrabase/number.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <optional>
#include <thread>
#include <unordered_map>
#include <utility>
#include <vector>

namespace OvraDRCore {

namespace {

using std::chrono::microseconds;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr std::int64_t kSecond = 1000;
constexpr std::int64_t kLongest = Cache::kLongestRefresh * kSecond;

/// Its stamp tells when a refresh of the entry failed last.
std::string failureOf(const std::string &name) {
    return name + std::string("\0failed", 7);
}

struct Stored {
    Json::Value value;
    std::int64_t age = -1; ///< milliseconds; negative: stamped in the future
};

/// The cache files as they were when this thread's listing first looked.
class Snapshots {
public:
    void enter() { ++depth_; }
    void leave() {
        if (--depth_ == 0) {
            files_.clear();
        }
    }
    bool active() const { return depth_ > 0; }

    /// Null if there is none; valid as long as the listing.
    const CacheEntry *find(const std::string &path, const std::string &name) {
        const auto [file, isNew] = files_.try_emplace(path);
        if (isNew) {
            for (CacheEntry &entry : CacheFile(path).readAll()) {
                std::string key = entry.name;
                file->second.insert_or_assign(std::move(key), std::move(entry));
            }
        }
        const auto entry = file->second.find(name);
        return entry == file->second.end() ? nullptr : &entry->second;
    }

private:
    int depth_ = 0;
    std::map<std::string, std::unordered_map<std::string, CacheEntry>> files_;
};

thread_local Snapshots snapshots;

/// \param listing  whether the snapshot of a listing will do
std::optional<Stored> load(const std::string &path, const std::string &name, int attempts,
                           bool listing = false) {
    std::optional<CacheEntry> read;
    const CacheEntry *entry = nullptr;
    if (listing && snapshots.active()) {
        entry = snapshots.find(path, name);
    } else if ((read = CacheFile(path).read(name, attempts))) {
        entry = &*read;
    }
    Stored stored;
    if (entry == nullptr || !fromString(stored.value, entry->value)) {
        return std::nullopt;
    }
    stored.age = OvraBase::saturatingDifference(systemMilliseconds(), entry->end);
    return stored;
}

/// The waiting of this thread for the refreshes of others.
class Patience {
public:
    void enter() {
        if (depth_++ == 0) {
            left_ = milliseconds(kLongest);
        }
    }
    void leave() { --depth_; }

    /// Sleeps for a moment, longer each time. \return false, at once, if there is no time left.
    bool pause(microseconds &moment) {
        if (left_ <= left_.zero()) {
            return false;
        }
        constexpr microseconds kLongestMoment{20'000};
        const auto begin = steady_clock::now();
        std::this_thread::sleep_for(std::min<steady_clock::duration>(moment, left_));
        left_ -= steady_clock::now() - begin;
        moment = std::min(2 * moment, kLongestMoment);
        return true;
    }

private:
    int depth_ = 0;
    steady_clock::duration left_{};
};

thread_local Patience patience;

/// An entry that this thread is refreshing, as long as this exists.
class Refreshing {
public:
    Refreshing(const std::string &path, const std::string &name) {
        keys.push_back(keyOf(path, name));
    }
    ~Refreshing() { keys.pop_back(); }
    Refreshing(const Refreshing &) = delete;
    Refreshing &operator=(const Refreshing &) = delete;

    static bool is(const std::string &path, const std::string &name) {
        return std::find(keys.begin(), keys.end(), keyOf(path, name)) != keys.end();
    }

private:
    static std::string keyOf(const std::string &path, const std::string &name) {
        return path + '\0' + name;
    }
    static thread_local std::vector<std::string> keys; ///< outermost first
};

thread_local std::vector<std::string> Refreshing::keys;

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
    if (Refreshing::is(path_, name_)) {
        return storedOrDefault();
    }
    const std::int64_t arrival = systemMilliseconds();
    const auto hasFailedMeanwhile = [&] {
        const auto failure = CacheFile(path_).read(failureOf(name_), count_);
        return failure && failure->end >= arrival && failure->end <= systemMilliseconds();
    };
    const CacheWaitScope scope;
    RefreshLock lock(path_, name_);
    RefreshLock::State state = lock.tryAcquire();
    if (state == RefreshLock::State::kBusy) {
        const bool presentable = stored && stored->age >= 0 &&
                                 stored->age <= lifetime_ * kSecond + kLongest &&
                                 IsValid(stored->value);
        if (presentable && !IsUpdatedDataRequired()) {
            return stored->value;
        }
        for (microseconds moment{50};
             state == RefreshLock::State::kBusy && patience.pause(moment);) {
            state = lock.tryAcquire();
            if (isUsable()) {
                return stored->value;
            }
            if (hasFailedMeanwhile()) {
                return storedOrDefault();
            }
        }
        if (state == RefreshLock::State::kBusy) {
            OVRA_WARN("Waited too long for the refresh of cache entry [%s], refreshing it here",
                      name_.c_str());
            lock.takeOver();
        }
    } else if (isUsable()) { // the previous holder of the lock may have stored it
        return stored->value;
    }
    Json::Value value;
    const Refresh result = refresh(value);
    if (isUsable()) { // this value or a younger one
        return stored->value;
    }
    return result == Refresh::kFailed ? storedOrDefault() : value;
}

Json::Value Cache::GetCachedData() const {
    const std::optional<Stored> stored = load(path_, name_, count_, true);
    return stored ? stored->value : Json::Value();
}

double Cache::GetCachedAge() const {
    const std::optional<Stored> stored = load(path_, name_, count_, true);
    return stored && stored->age >= 0 ? static_cast<double>(stored->age) / kSecond : -1;
}

bool Cache::Update() const {
    // Concurrent readers share this refresh; one that another process began earlier may already be
    // out of date, so it is not waited for.
    const CacheWaitScope scope;
    RefreshLock lock(path_, name_);
    lock.tryAcquire();
    Json::Value value;
    return refresh(value) == Refresh::kStored;
}

Cache::Refresh Cache::refresh(Json::Value &value) const {
    const std::int64_t start = Now();
    const bool fetched = [&] {
        const Refreshing mark(path_, name_);
        return GetUpdatedData(value);
    }();
    if (!fetched) {
        const std::int64_t now = Now();
        CacheFile(path_).write({failureOf(name_), "", now, now, 0}, now);
        return Refresh::kFailed;
    }
    // Whoever asked has what could not be stored all the same.
    return UpdateWithFinding(value, start) ? Refresh::kStored : Refresh::kFetched;
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

std::int64_t Cache::Now() {
    return systemMilliseconds();
}

bool Cache::UpdateWithFinding(const Json::Value &value, std::int64_t start) const {
    const std::int64_t now = Now();
    // The clock may have been set back.
    const std::int64_t end = now < start ? now : std::min(now, start + kLongest);
    return CacheFile(path_).write({name_, toString(value), start, end, lifetime_ * kSecond}, now,
                                  CacheFile::Younger::kKeep);
}

bool Cache::Remove() {
    return CacheFile(path_).remove(name_);
}

CacheSnapshotScope::CacheSnapshotScope() {
    snapshots.enter();
}

CacheSnapshotScope::~CacheSnapshotScope() {
    snapshots.leave();
}

CacheWaitScope::CacheWaitScope() {
    patience.enter();
}

CacheWaitScope::~CacheWaitScope() {
    patience.leave();
}

} // namespace OvraDRCore
