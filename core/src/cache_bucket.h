// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace OvraDRCore {

/// One entry of a cache file. Times are milliseconds since the epoch.
struct CacheEntry {
    std::string name;
    std::string value; ///< JSON text
    std::int64_t start = 0;
    std::int64_t end = 0;
    std::int64_t lifetime = 0; ///< milliseconds
};

/// Whether an entry with that end and lifetime expired before `oldest`. In a forged file they may
/// be any numbers.
bool isLongPast(std::int64_t end, std::int64_t lifetime, std::int64_t oldest);

/// One copy of a bucket as stored in the file: a header, then the entries back to back. Numbers are
/// in host byte order: the file never leaves its machine.
class BucketImage {
public:
    static constexpr std::size_t kSize = 4096;
    static constexpr std::uint64_t kLastSequence = UINT64_MAX - 1;

    /// The sequence number in the header, unchecked.
    static std::uint64_t claimedSequence(const std::byte *copy);
    /// Checks the copy and its position in the file.
    /// \return the sequence number (0: never written); std::nullopt if the copy is damaged.
    static std::optional<std::uint64_t> check(const std::byte *copy, std::uint32_t bucketCount,
                                              std::uint32_t bucketIndex);
    /// Finds one entry of a checked copy without decoding the others.
    static std::optional<CacheEntry> find(const std::byte *copy, std::string_view name);
    /// All entries of a checked copy.
    static std::vector<CacheEntry> entries(const std::byte *copy);

    /// Bytes of capacity() that an entry takes.
    static std::size_t measure(const CacheEntry &entry);
    static std::size_t capacity();

    explicit BucketImage(std::uint32_t bucketCount, std::uint32_t bucketIndex)
        : bucketCount_(bucketCount)
        , bucketIndex_(bucketIndex) {}
    /// Copies the entries of a checked copy, except that of `name` and those that expired before
    /// `oldest`.
    /// \return false if there is no room for them.
    bool copyFrom(const std::byte *copy, std::string_view name, std::int64_t oldest);
    /// \return false if there is no room.
    bool add(const CacheEntry &entry);
    /// Completes the copy. \return its bytes.
    std::string_view finish(std::uint64_t sequence);

private:
    bool append(std::int64_t start, std::int64_t end, std::int64_t lifetime, std::string_view name,
                std::string_view value);

    std::uint32_t bucketCount_;
    std::uint32_t bucketIndex_;
    std::size_t used_ = 0;
    std::array<std::byte, kSize> bytes_;
};

/// The hash that selects an entry's bucket and its refresh lock (XXH3, 64 bits).
std::uint64_t cacheNameHash(std::string_view name);

} // namespace OvraDRCore
