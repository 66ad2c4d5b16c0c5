// SPDX-License-Identifier: Apache-2.0
#include "cache_bucket.h"

#include <ovrabase/number.h>

#include <xxhash.h>

#include <cstring>

namespace OvraDRCore {

namespace {

constexpr std::uint32_t kMagic = 0x3143564FU; // "OVC1"

struct Header {
    std::uint64_t checksum; // XXH3 of everything after it, to the end of the entries
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

/// Calls visit(header, name, value) for each entry until it returns false. The sizes are checked
/// although they are under the checksum, because a forged file has a valid checksum too.
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

bool isLongPast(std::int64_t end, std::int64_t lifetime, std::int64_t oldest) {
    return end < OvraBase::saturatingDifference(oldest, lifetime);
}

std::uint64_t BucketImage::claimedSequence(const std::byte *copy) {
    return headerOf(copy).sequence;
}

std::optional<std::uint64_t> BucketImage::check(const std::byte *copy, std::uint32_t bucketCount,
                                                std::uint32_t bucketIndex) {
    const Header header = headerOf(copy);
    if (header.magic == 0 && header.checksum == 0 && header.sequence == 0 && header.used == 0) {
        return 0; // a hole in the file
    }
    if (header.magic != kMagic || header.bucketCount != bucketCount ||
        header.bucketIndex != bucketIndex || header.used > kCapacity || header.sequence == 0 ||
        header.sequence > kLastSequence || header.checksum != checksumOf(copy, header.used)) {
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

std::size_t BucketImage::measure(const CacheEntry &entry) {
    return sizeof(EntryHeader) + entry.name.size() + entry.value.size();
}

std::size_t BucketImage::capacity() {
    return kCapacity;
}

bool BucketImage::append(std::int64_t start, std::int64_t end, std::int64_t lifetime,
                         std::string_view name, std::string_view value) {
    const std::size_t size = sizeof(EntryHeader) + name.size() + value.size();
    if (size > kCapacity - used_) {
        return false;
    }
    const EntryHeader header{start, end, lifetime, static_cast<std::uint32_t>(name.size()),
                             static_cast<std::uint32_t>(value.size())};
    std::byte *place = bytes_.data() + sizeof(Header) + used_;
    std::memcpy(place, &header, sizeof(header));
    std::memcpy(place + sizeof(header), name.data(), name.size());
    std::memcpy(place + sizeof(header) + name.size(), value.data(), value.size());
    used_ += size;
    return true;
}

bool BucketImage::copyFrom(const std::byte *copy, std::string_view name, std::int64_t oldest) {
    bool room = true;
    forEach(copy, [&](const EntryHeader &header, std::string_view key, std::string_view value) {
        if (key != name && !isLongPast(header.end, header.lifetime, oldest)) {
            room = append(header.start, header.end, header.lifetime, key, value);
        }
        return room;
    });
    return room;
}

bool BucketImage::add(const CacheEntry &entry) {
    return append(entry.start, entry.end, entry.lifetime, entry.name, entry.value);
}

std::string_view BucketImage::finish(std::uint64_t sequence) {
    Header header{0,       kMagic, bucketCount_, bucketIndex_, static_cast<std::uint32_t>(used_),
                  sequence};
    std::memcpy(bytes_.data(), &header, sizeof(header));
    header.checksum = checksumOf(bytes_.data(), used_);
    std::memcpy(bytes_.data(), &header, sizeof(header));
    return textAt(bytes_.data(), sizeof(Header) + used_);
}

std::uint64_t cacheNameHash(std::string_view name) {
    return XXH3_64bits(name.data(), name.size());
}

} // namespace OvraDRCore
