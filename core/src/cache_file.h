// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "cache_bucket.h"

#include <ovrabase/unique_fd.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraDRCore {

/// The operations on one cache file; each opens and closes it. Format: docs/files.md.
class CacheFile {
public:
    explicit CacheFile(const std::string &path);

    /// \param attempts  reads that may collide with a write before one waits for the lock
    std::optional<CacheEntry> read(std::string_view name, int attempts) const;
    /// Adds or replaces; drops long-expired entries of the same bucket.
    bool write(const CacheEntry &entry, std::int64_t now) const;
    /// True if the entry does not exist afterwards.
    bool remove(std::string_view name) const;

    /// The next write to its bucket drops an entry that has been stale for this long. The last
    /// known facts of a node that is away for some days are worth keeping.
    static constexpr std::int64_t kKeepStale = std::int64_t{7} * 24 * 3600 * 1000;
    /// Capacity of one entry: name and value together.
    static std::size_t maxEntrySize();

private:
    std::string path_;
};

/// The right to refresh one entry, held by one process on the appliance at a time: a byte of the
/// lock file next to the cache file, selected by the entry's name (fcntl(2), open file description
/// locks). It is released when the process dies.
class RefreshLock {
public:
    RefreshLock(const std::string &path, const std::string &name);
    ~RefreshLock();
    RefreshLock(const RefreshLock &) = delete;
    RefreshLock &operator=(const RefreshLock &) = delete;

    /// This thread is already refreshing this entry, further up the call stack.
    bool isHeldHere() const;
    bool tryAcquire();
    /// Waits at most `seconds`.
    bool acquire(long seconds);
    /// There is a directory that all processes can share.
    bool isUsable() const { return static_cast<bool>(file_); }

private:
    std::string key_;
    std::uint64_t offset_;
    OvraBase::UniqueFd file_;
    bool held_ = false;
};

} // namespace OvraDRCore
