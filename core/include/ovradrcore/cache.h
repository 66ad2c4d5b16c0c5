// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <cstdint>
#include <string>

namespace OvraDRCore {

/// A named JSON value with a lifetime, in a cache file that all processes of the appliance share,
/// refreshed through GetUpdatedData().
///
/// Every operation opens the file, does its work and closes it. An update is atomic between
/// processes, even if the process dies at any instruction; a read takes no lock. A directory or
/// file that is damaged, or not exclusively ours, reads as empty; the library then works without a
/// cache. Format, limits and recovery: docs/files.md.
///
/// Refreshing: an entry that is absent, older than its lifetime, stamped in the future or rejected
/// by IsValid() is refreshed by one process at a time. No lock on the file is held meanwhile. A
/// reader that waits for another one's refresh takes what that one stores, or its failure. If that
/// one dies, or has not ended after kLongestRefresh, the reader refreshes the entry itself; within
/// a CacheWaitScope the waits for all entries together are that long at most. A refreshed value is
/// as old as the end of GetUpdatedData(), at most kLongestRefresh after its begin: a process that
/// was stopped meanwhile has old news. It never replaces a younger value.
class OVRADRCORE_EXPORT Cache {
public:
    virtual ~Cache();
    /// A short description of the entry: "name" and one identifying member.
    virtual Json::Value GetInfo() const = 0;
    /// The value if no usable one is stored and none can be fetched; null by default.
    virtual Json::Value GetDefaultValue() const;
    /// Fetches a fresh value into `value`; false: there is none, and the stored value must stay.
    [[nodiscard]] virtual bool GetUpdatedData(Json::Value &value) const = 0;
    /// Whether a stored value is usable.
    virtual bool IsValid(const Json::Value &value) const = 0;
    /// A further reason to refresh a value that is still fresh; false by default.
    virtual bool IsNeedUpdate(const Json::Value &value) const;
    /// Whether a reader needs fresh data while another process fetches it: if true, it waits for
    /// that process and uses its result; if false, it uses a stored value at once that has expired
    /// kLongestRefresh ago at most. By default: the `flag` of the constructor.
    virtual bool IsUpdatedDataRequired() const;

    /// Seconds that a refresh may take before others no longer wait for it: the probe of an
    /// endpoint that says nothing (10 seconds), and a bit.
    static constexpr long kLongestRefresh = 11;

    /// \param path      the cache file; its directory is created with mode 0700 if missing
    /// \param name      the entry's key in the file
    /// \param lifetime  seconds for which a stored value is fresh
    /// \param flag      the result of IsUpdatedDataRequired() unless it is overridden
    /// \param count     how often a read that collides with a write is retried without a lock
    Cache(const std::string &path, const std::string &name, long lifetime, bool flag, int count);
    Cache(const Cache &) = default;
    Cache &operator=(const Cache &) = default;

    /// The current value, refreshed if needed.
    Json::Value Read() const;
    /// The stored value, however old; null if there is none. Sends nothing.
    Json::Value GetCachedData() const;
    /// Age of the stored value in seconds, or -1 if nothing is stored (or it is stamped in the
    /// future). Sends nothing.
    double GetCachedAge() const;
    /// Seconds for which a stored value is fresh.
    long GetLifetime() const { return lifetime_; }
    /// Fetches now, whatever is stored, and stores the result.
    /// \return false if nothing could be fetched, or the result could not be stored.
    bool Update() const;
    /// Stores `value` as taken now; false if it could not be stored.
    bool UpdateWithData(const Json::Value &value) const;
    /// Stores `value` as measured from `start` to `end` (seconds of the system clock), even if a
    /// younger value is stored.
    bool UpdateWithData(const Json::Value &value, long start, long end) const;
    /// Milliseconds of the system clock.
    static std::int64_t Now();
    /// Stores `value` as found by something that began at `start` (Now()) and has just ended. It is
    /// as old as a refreshed value, and never replaces a younger one either.
    /// \return false if it could not be stored.
    bool UpdateWithFinding(const Json::Value &value, std::int64_t start) const;
    /// Deletes the entry; succeeds if there is none.
    bool Remove();

private:
    enum class Refresh { kFailed, kFetched, kStored };
    Refresh refresh(Json::Value &value) const;

    std::string path_;
    std::string name_;
    long lifetime_;
    bool flag_;
    int count_;
};

/// A listing of this thread: while a scope exists, GetCachedData() and GetCachedAge() look into
/// each cache file as it was when the first of them did, read at once. So what they say of ten
/// thousand entries costs a reading of the file, not ten thousand. Nothing else changes, and
/// Read() refreshes what is stale as ever. A scope within a scope changes nothing.
class OVRADRCORE_EXPORT CacheSnapshotScope {
public:
    CacheSnapshotScope();
    ~CacheSnapshotScope();
    CacheSnapshotScope(const CacheSnapshotScope &) = delete;
    CacheSnapshotScope &operator=(const CacheSnapshotScope &) = delete;
};

/// One request of this thread, which may read several cache entries: while a scope exists, the
/// thread waits Cache::kLongestRefresh in sum at most for refreshes by others, then refreshes
/// itself whatever is being refreshed. A scope within a scope changes nothing.
class OVRADRCORE_EXPORT CacheWaitScope {
public:
    CacheWaitScope();
    ~CacheWaitScope();
    CacheWaitScope(const CacheWaitScope &) = delete;
    CacheWaitScope &operator=(const CacheWaitScope &) = delete;
};

} // namespace OvraDRCore
