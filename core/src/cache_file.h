// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "cache_bucket.h"

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
    /// Every entry, in no order, without a lock; those of a bucket that is being written may be
    /// missing.
    std::vector<CacheEntry> readAll() const;
    /// What happens to a stored value that was taken later than the one to write; one with a stamp
    /// in the future never stays.
    enum class Younger { kReplace, kKeep };
    /// Adds or replaces; drops long-expired entries of the same bucket.
    /// \return whether the file holds the entry, or a younger one that was to be kept.
    bool write(const CacheEntry &entry, std::int64_t now,
               Younger younger = Younger::kReplace) const;
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

} // namespace OvraDRCore
