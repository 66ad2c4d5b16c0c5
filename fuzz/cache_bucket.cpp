// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <cache_bucket.h>
#include <xxhash.h>

#include <algorithm>
#include <array>
#include <cstring>

using OvraDRCore::BucketImage;
using OvraDRCore::CacheEntry;
using OvraFuzz::require;

namespace {

using Copy = std::array<std::byte, BucketImage::kSize>;

/// Gives the copy the checksum that it would have, as somebody would who may write to the file. At
/// 0: the checksum of what follows; at 20: the bytes of entries.
void forge(Copy &copy) {
    std::uint32_t used = 0;
    std::memcpy(&used, copy.data() + 20, sizeof(used));
    const std::uint64_t sum =
        XXH3_64bits(copy.data() + 8, 24 + std::min<std::size_t>(used, copy.size() - 32));
    std::memcpy(copy.data(), &sum, sizeof(sum));
}

} // namespace

// Whatever is in a copy, its entries lie within it, and what is left of them can be written again.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    Copy copy{};
    std::memcpy(copy.data(), data, std::min(size, copy.size()));
    std::uint32_t count = 0;
    std::uint32_t index = 0;
    std::memcpy(&count, copy.data() + 12, sizeof(count));
    std::memcpy(&index, copy.data() + 16, sizeof(index));
    forge(copy);
    if (!BucketImage::check(copy.data(), count, index).value_or(0)) {
        return 0;
    }
    BucketImage image(count, index);
    require(image.copyFrom(copy.data(), "new", INT64_MIN), "a copy of what fits fits");
    const CacheEntry entry{"new", "1", 1, 2, 3};
    const bool fits = image.add(entry);
    Copy next{};
    const std::string_view bytes = image.finish(7);
    require(bytes.size() <= next.size(), "a copy keeps its size");
    std::memcpy(next.data(), bytes.data(), bytes.size());
    require(BucketImage::check(next.data(), count, index) == 7U, "what was written is whole");
    require(BucketImage::find(next.data(), "new").has_value() == fits, "what was added is found");
    for (const CacheEntry &old : BucketImage::entries(copy.data())) {
        require(old.name == "new" || old.lifetime < 0 ||
                    BucketImage::find(next.data(), old.name).has_value(),
                "every other entry is kept");
    }
    return 0;
}
