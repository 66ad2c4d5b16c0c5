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

/// One copy of a bucket as it lies in the file: a header, then entries one behind the other.
/// Numbers are in host byte order: the file never leaves its machine.
class BucketImage {
public:
    static constexpr std::size_t kSize = 4096;

    /// Checks the copy and its place in the file.
    /// \return the sequence number (0: never written), or nothing when the copy is damaged.
    static std::optional<std::uint64_t> check(const std::byte *copy, std::uint32_t bucketCount,
                                              std::uint32_t bucketIndex);
    /// Finds one entry of a checked copy without taking the others apart.
    static std::optional<CacheEntry> find(const std::byte *copy, std::string_view name);
    /// All entries of a checked copy.
    static std::vector<CacheEntry> entries(const std::byte *copy);

    /// Bytes that the entries need; more than capacity() do not fit.
    static std::size_t measure(const std::vector<CacheEntry> &entries);
    static std::size_t capacity();
    /// Writes header and entries. \return bytes to store from the start of `copy`.
    static std::size_t encode(std::array<std::byte, kSize> &copy, std::uint32_t bucketCount,
                              std::uint32_t bucketIndex, std::uint64_t sequence,
                              const std::vector<CacheEntry> &entries);
};

/// The hash that chooses an entry's bucket and its refresh lock (XXH3, 64 bits).
std::uint64_t cacheNameHash(std::string_view name);

} // namespace OvraDRCore
