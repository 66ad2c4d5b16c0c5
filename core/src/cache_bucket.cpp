// SPDX-License-Identifier: Apache-2.0
#include "cache_bucket.h"

#include <xxhash.h>

#include <cstring>

namespace OvraDRCore {

namespace {

constexpr std::uint32_t kMagic = 0x3143564FU; // "OVC1"

struct Header {
    std::uint64_t checksum; // XXH3 of all that follows, to the end of the entries
    std::uint32_t magic;
    std::uint32_t bucketCount;
    std::uint32_t bucketIndex;
    std::uint32_t used; // bytes of entries
    std::uint64_t sequence;
};
static_assert(sizeof(Header) == 32);

struct EntryHeader {
    std::int64_t start;
    std::int64_t end;
    std::int64_t lifetime;
    std::uint32_t nameSize;
    std::uint32_t valueSize;
};
static_assert(sizeof(EntryHeader) == 32);

constexpr std::size_t kCapacity = BucketImage::kSize - sizeof(Header);

Header headerOf(const std::byte *copy) {
    Header header{};
    std::memcpy(&header, copy, sizeof(header));
    return header;
}

std::uint64_t checksumOf(const std::byte *copy, std::size_t used) {
    return XXH3_64bits(copy + sizeof(Header::checksum),
                       sizeof(Header) - sizeof(Header::checksum) + used);
}

std::string_view textAt(const std::byte *place, std::size_t size) {
    return {reinterpret_cast<const char *>(place), size};
}

/// Calls visit(header, name, value) for each entry until it returns false. The checksum vouches for
/// the sizes, but a file that somebody made on purpose has a right checksum too: they are checked.
template <typename Visit>
void forEach(const std::byte *copy, Visit visit) {
    const std::size_t used = headerOf(copy).used;
    const std::byte *place = copy + sizeof(Header);
    std::size_t left = used;
    while (left >= sizeof(EntryHeader)) {
        EntryHeader entry{};
        std::memcpy(&entry, place, sizeof(entry));
        place += sizeof(entry);
        left -= sizeof(entry);
        if (entry.nameSize > left || entry.valueSize > left - entry.nameSize) {
            return;
        }
        const std::string_view name = textAt(place, entry.nameSize);
        const std::string_view value = textAt(place + entry.nameSize, entry.valueSize);
        if (!visit(entry, name, value)) {
            return;
        }
        place += entry.nameSize + entry.valueSize;
        left -= entry.nameSize + entry.valueSize;
    }
}

CacheEntry toEntry(const EntryHeader &header, std::string_view name, std::string_view value) {
    return {std::string(name), std::string(value), header.start, header.end, header.lifetime};
}

} // namespace

std::optional<std::uint64_t> BucketImage::check(const std::byte *copy, std::uint32_t bucketCount,
                                                std::uint32_t bucketIndex) {
    const Header header = headerOf(copy);
    if (header.magic == 0 && header.checksum == 0 && header.sequence == 0 && header.used == 0) {
        return 0; // a hole of the file
    }
    if (header.magic != kMagic || header.bucketCount != bucketCount ||
        header.bucketIndex != bucketIndex || header.used > kCapacity || header.sequence == 0 ||
        header.sequence == UINT64_MAX || header.checksum != checksumOf(copy, header.used)) {
        return std::nullopt;
    }
    return header.sequence;
}

std::optional<CacheEntry> BucketImage::find(const std::byte *copy, std::string_view name) {
    std::optional<CacheEntry> found;
    forEach(copy, [&](const EntryHeader &header, std::string_view key, std::string_view value) {
        if (key == name) {
            found = toEntry(header, key, value);
        }
        return !found;
    });
    return found;
}

std::vector<CacheEntry> BucketImage::entries(const std::byte *copy) {
    std::vector<CacheEntry> all;
    forEach(copy, [&](const EntryHeader &header, std::string_view key, std::string_view value) {
        all.push_back(toEntry(header, key, value));
        return true;
    });
    return all;
}

std::size_t BucketImage::measure(const std::vector<CacheEntry> &entries) {
    std::size_t size = 0;
    for (const CacheEntry &entry : entries) {
        size += sizeof(EntryHeader) + entry.name.size() + entry.value.size();
    }
    return size;
}

std::size_t BucketImage::capacity() {
    return kCapacity;
}

std::size_t BucketImage::encode(std::array<std::byte, kSize> &copy, std::uint32_t bucketCount,
                                std::uint32_t bucketIndex, std::uint64_t sequence,
                                const std::vector<CacheEntry> &entries) {
    std::byte *place = copy.data() + sizeof(Header);
    for (const CacheEntry &entry : entries) {
        const EntryHeader header{entry.start, entry.end, entry.lifetime,
                                 static_cast<std::uint32_t>(entry.name.size()),
                                 static_cast<std::uint32_t>(entry.value.size())};
        std::memcpy(place, &header, sizeof(header));
        place += sizeof(header);
        std::memcpy(place, entry.name.data(), entry.name.size());
        place += entry.name.size();
        std::memcpy(place, entry.value.data(), entry.value.size());
        place += entry.value.size();
    }
    const auto total = static_cast<std::size_t>(place - copy.data());
    const std::size_t used = total - sizeof(Header);
    Header header{0, kMagic, bucketCount, bucketIndex, static_cast<std::uint32_t>(used), sequence};
    std::memcpy(copy.data(), &header, sizeof(header));
    header.checksum = checksumOf(copy.data(), used);
    std::memcpy(copy.data(), &header, sizeof(header));
    return total;
}

std::uint64_t cacheNameHash(std::string_view name) {
    return XXH3_64bits(name.data(), name.size());
}

} // namespace OvraDRCore
