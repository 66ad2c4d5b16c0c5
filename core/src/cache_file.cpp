// SPDX-License-Identifier: Apache-2.0
#include "cache_file.h"

#include "cache_folder.h"
#include "ovradrcore/log.h"

#include <ovrabase/expected.h>
#include <ovrabase/file.h>
#include <ovrabase/lock.h>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <iterator>

namespace OvraDRCore {

namespace {

using OvraBase::LockedFd;
using OvraBase::UniqueFd;

constexpr std::size_t kPair = 2 * BucketImage::kSize;
constexpr std::uint32_t kMinBuckets = 16;
constexpr std::uint32_t kMaxBuckets = 65536;
/// A bucket that overflows in a file emptier than this holds deliberately colliding names, or huge
/// values: its oldest entries are evicted, and the file does not grow.
constexpr std::uint64_t kMinLoadToGrow = 64;
constexpr std::chrono::milliseconds kLockWait{2000};

using Pair = std::array<std::byte, kPair>;

/// The number of buckets of a file of this size; 0 if it is not the size of a cache file.
std::uint32_t bucketsOf(const struct stat &status) {
    const auto size = static_cast<std::uint64_t>(status.st_size);
    const std::uint64_t buckets = size / kPair;
    const bool right = S_ISREG(status.st_mode) && isOursAlone(status) && size % kPair == 0 &&
                       buckets >= kMinBuckets && buckets <= kMaxBuckets &&
                       std::has_single_bit(buckets);
    return right ? static_cast<std::uint32_t>(buckets) : 0;
}

bool readPair(int fd, std::uint32_t index, Pair &pair) {
    const auto offset = static_cast<off_t>(index) * static_cast<off_t>(kPair);
    return pread(fd, pair.data(), pair.size(), offset) == static_cast<ssize_t>(pair.size());
}

std::uint32_t bucketOf(std::string_view name, std::uint32_t buckets) {
    return static_cast<std::uint32_t>(cacheNameHash(name)) & (buckets - 1);
}

/// Which of the two copies is current, and which is overwritten next.
struct Choice {
    bool valid = false; ///< at least one copy is valid
    std::size_t newer = 0;
    std::uint64_t sequence = 0;
};

/// Checks the copy with the higher sequence number first, and the other one only if that is
/// damaged.
Choice choose(const Pair &pair, std::uint32_t buckets, std::uint32_t index) {
    const std::byte *second = pair.data() + BucketImage::kSize;
    const bool secondIsNewer =
        BucketImage::claimedSequence(second) > BucketImage::claimedSequence(pair.data());
    const std::size_t likely = secondIsNewer ? 1 : 0;
    for (const std::size_t which : {likely, 1 - likely}) {
        const std::byte *copy = pair.data() + which * BucketImage::kSize;
        if (const auto sequence = BucketImage::check(copy, buckets, index)) {
            return {true, which, *sequence};
        }
    }
    return {};
}

const std::byte *chosenCopy(const Pair &pair, const Choice &choice) {
    return pair.data() + choice.newer * BucketImage::kSize;
}

bool storeCopy(int fd, std::uint32_t index, std::size_t which, std::string_view bytes) {
    const auto offset = static_cast<off_t>(index) * static_cast<off_t>(kPair) +
                        static_cast<off_t>(which * BucketImage::kSize);
    return pwrite(fd, bytes.data(), bytes.size(), offset) == static_cast<ssize_t>(bytes.size());
}

/// The file at `path`, if it is still the one that was opened.
std::optional<struct stat> lookAgain(const std::string &path, const struct stat &opened) {
    struct stat now {};
    const bool same = lstat(path.c_str(), &now) == 0 && now.st_dev == opened.st_dev &&
                      now.st_ino == opened.st_ino;
    return same ? std::optional(now) : std::nullopt;
}

/// Takes the file at `path` away if it is still the one that was opened, and nobody has written to
/// it since: then whoever keeps its lock, which takes a writer microseconds, is stopped or hangs.
/// \return whether the path is free for a new file, or has one
bool replaceStuck(const std::string &path, const struct stat &opened) {
    // Those who have waited at once would take away each other's new file.
    const auto alone = LockedFd::lock(
        UniqueFd(open(OvraBase::folderOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)),
        LOCK_EX, kLockWait);
    const std::optional<struct stat> now = lookAgain(path, opened);
    const bool stuck = now && now->st_mtim.tv_sec == opened.st_mtim.tv_sec &&
                       now->st_mtim.tv_nsec == opened.st_mtim.tv_nsec;
    if (!alone || !stuck || unlink(path.c_str()) != 0) {
        return !now;
    }
    OVRA_WARN("Cache file [%s] was locked for too long, beginning a new one", path.c_str());
    return true;
}

/// A cache file under its exclusive lock.
class LockedFile {
public:
    /// Opens and locks the file at `path`; one that is damaged, foreign or stuck is replaced.
    static std::optional<LockedFile> open(const std::string &path, bool create) {
        // Between opening and locking, growing may have replaced the file.
        for (int attempt = 0; attempt < 100; ++attempt) {
            LockedFile file;
            UniqueFd fd = openOrReplaceCacheFile(path, create ? O_RDWR | O_CREAT : O_RDWR);
            struct stat status {};
            if (!fd || fstat(fd.get(), &status) != 0) {
                return std::nullopt;
            }
            auto locked = LockedFd::lock(std::move(fd), LOCK_EX, kLockWait);
            if (!locked && locked.error().number == ETIMEDOUT && replaceStuck(path, status)) {
                continue;
            }
            if (!locked) {
                OVRA_WARN("Cache file [%s] cannot be locked: %s", path.c_str(),
                          locked.error().text.c_str());
                return std::nullopt;
            }
            file.fd_ = std::move(*locked);
            if (fstat(file.fd_.get(), &status) != 0) {
                return std::nullopt;
            }
            if (status.st_nlink == 0) {
                continue;
            }
            file.buckets_ = bucketsOf(status);
            if (file.buckets_ != 0) {
                return file;
            }
            if (ftruncate(file.fd_.get(), 0) != 0 ||
                ftruncate(file.fd_.get(), static_cast<off_t>(kMinBuckets * kPair)) != 0) {
                return std::nullopt;
            }
            file.buckets_ = kMinBuckets;
            return file;
        }
        return std::nullopt;
    }

    /// Reads the bucket of `name` into `pair`, which must outlive the use of the bucket.
    /// \return false if it cannot be read: what is in it is unknown, and nothing is stored over it.
    [[nodiscard]] bool load(std::string_view name, Pair &pair) {
        index_ = bucketOf(name, buckets_);
        if (!readPair(fd_.get(), index_, pair)) {
            return false;
        }
        choice_ = choose(pair, buckets_, index_);
        copy_ = choice_.valid ? chosenCopy(pair, choice_) : nullptr;
        return true;
    }

    /// The valid copy of the loaded bucket; null if there is none.
    const std::byte *copy() const { return copy_; }

    /// An empty copy for the loaded bucket.
    BucketImage image() const { return BucketImage(buckets_, index_); }

    /// Replaces the older copy of the loaded bucket.
    bool store(BucketImage &image) {
        const std::size_t older = choice_.valid ? 1 - choice_.newer : 0;
        if (choice_.sequence == BucketImage::kLastSequence) {
            // Only a forged file gets there: both copies begin anew, the visible one last.
            return storeCopy(fd_.get(), index_, older, image.finish(1)) &&
                   storeCopy(fd_.get(), index_, choice_.newer, image.finish(2));
        }
        return storeCopy(fd_.get(), index_, older, image.finish(choice_.sequence + 1));
    }

    /// Rewrites the file with twice the buckets, without long-expired entries, and switches to it.
    /// \return false if growing is not allowed or fails: the old file is unchanged.
    bool grow(const std::string &path, std::int64_t oldest) {
        if (buckets_ == kMaxBuckets) {
            return false;
        }
        const std::uint32_t buckets = 2 * buckets_;
        // Only the lock holder gets here, so a left-over of the same name is stale.
        const std::string temporary = path + ".new";
        std::error_code ignored;
        std::filesystem::remove_all(temporary, ignored);
        auto grown =
            LockedFd::lock(openCacheFile(temporary, O_RDWR | O_CREAT | O_EXCL), LOCK_EX, {});
        bool written = grown && ftruncate(grown->get(), static_cast<off_t>(buckets * kPair)) == 0;
        std::uint64_t total = 0;
        for (std::uint32_t index = 0; written && index < buckets_; ++index) {
            written = split(grown->get(), index, oldest, total);
        }
        const bool worthIt = total * kMinLoadToGrow >= std::uint64_t{buckets_} * BucketImage::kSize;
        // Who was stopped in here may have lost its place to a new file.
        struct stat status {};
        const bool inPlace = fstat(fd_.get(), &status) == 0 && lookAgain(path, status);
        if (!written || !worthIt || !inPlace || rename(temporary.c_str(), path.c_str()) != 0) {
            unlink(temporary.c_str());
            return false;
        }
        fd_ = std::move(*grown);
        buckets_ = buckets;
        return true;
    }

private:
    /// Splits one bucket into the two corresponding ones of the grown file.
    bool split(int grown, std::uint32_t index, std::int64_t oldest, std::uint64_t &total) const {
        Pair pair;
        if (!readPair(fd_.get(), index, pair)) {
            return false;
        }
        const Choice choice = choose(pair, buckets_, index);
        if (choice.sequence == 0) {
            return true;
        }
        BucketImage low(2 * buckets_, index);
        BucketImage high(2 * buckets_, index + buckets_);
        for (const CacheEntry &entry : BucketImage::entries(chosenCopy(pair, choice))) {
            if (isLongPast(entry.end, entry.lifetime, oldest)) {
                continue;
            }
            total += BucketImage::measure(entry);
            (bucketOf(entry.name, 2 * buckets_) == index ? low : high).add(entry);
        }
        return storeCopy(grown, index, 0, low.finish(1)) &&
               storeCopy(grown, index + buckets_, 0, high.finish(1));
    }

    LockedFd fd_;
    std::uint32_t buckets_ = 0;
    std::uint32_t index_ = 0;
    Choice choice_;
    const std::byte *copy_ = nullptr;
};

/// The entries of a copy except `name`, newest first.
std::vector<CacheEntry> newestFirst(const std::byte *copy, std::string_view name) {
    std::vector<CacheEntry> entries = BucketImage::entries(copy);
    std::erase_if(entries, [&](const CacheEntry &entry) { return entry.name == name; });
    std::sort(entries.begin(), entries.end(),
              [](const CacheEntry &left, const CacheEntry &right) { return left.end > right.end; });
    return entries;
}

/// The loaded bucket with `entry` added. \return false if there is no room for all.
bool compose(const LockedFile &file, const CacheEntry &entry, std::int64_t oldest,
             BucketImage &image) {
    image = file.image();
    return (file.copy() == nullptr || image.copyFrom(file.copy(), entry.name, oldest)) &&
           image.add(entry);
}

} // namespace

CacheFile::CacheFile(const std::string &path)
    : path_(path) {}

std::size_t CacheFile::maxEntrySize() {
    return BucketImage::capacity() - BucketImage::measure(CacheEntry{});
}

std::optional<CacheEntry> CacheFile::read(std::string_view name, int attempts) const {
    if (!checkCacheFolder(OvraBase::folderOf(path_), false)) {
        return std::nullopt;
    }
    const UniqueFd fd = openCacheFile(path_, O_RDONLY);
    struct stat status {};
    if (!fd || fstat(fd.get(), &status) != 0) {
        return std::nullopt;
    }
    const std::uint32_t buckets = bucketsOf(status);
    if (buckets == 0) {
        return std::nullopt;
    }
    const std::uint32_t index = bucketOf(name, buckets);
    Pair pair;
    for (int attempt = 0; attempt <= attempts; ++attempt) {
        // Two writes during one read can tear both copies. The last attempt takes the lock.
        const bool lastAttempt = attempt == attempts;
        if (lastAttempt && !OvraBase::lockFile(fd.get(), LOCK_SH, kLockWait)) {
            return std::nullopt;
        }
        const bool whole = readPair(fd.get(), index, pair);
        if (lastAttempt) {
            OvraBase::unlockFile(fd.get());
        }
        if (!whole) {
            return std::nullopt;
        }
        const Choice choice = choose(pair, buckets, index);
        if (choice.valid) {
            return BucketImage::find(chosenCopy(pair, choice), name);
        }
    }
    return std::nullopt;
}

std::vector<CacheEntry> CacheFile::readAll() const {
    std::vector<CacheEntry> all;
    if (!checkCacheFolder(OvraBase::folderOf(path_), false)) {
        return all;
    }
    const UniqueFd fd = openCacheFile(path_, O_RDONLY);
    struct stat status {};
    const std::uint32_t buckets = fd && fstat(fd.get(), &status) == 0 ? bucketsOf(status) : 0;
    Pair pair;
    for (std::uint32_t index = 0; index < buckets && readPair(fd.get(), index, pair); ++index) {
        const Choice choice = choose(pair, buckets, index);
        if (choice.valid) {
            std::vector<CacheEntry> entries = BucketImage::entries(chosenCopy(pair, choice));
            std::move(entries.begin(), entries.end(), std::back_inserter(all));
        }
    }
    return all;
}

bool CacheFile::write(const CacheEntry &entry, std::int64_t now, Younger younger) const {
    if (entry.name.size() + entry.value.size() > maxEntrySize()) {
        OVRA_WARN("Value of cache entry [%s] in [%s] is too large: %zu bytes, %zu fit",
                  entry.name.c_str(), path_.c_str(), entry.value.size(),
                  maxEntrySize() - std::min(maxEntrySize(), entry.name.size()));
        return false;
    }
    if (!checkCacheFolder(OvraBase::folderOf(path_), true)) {
        return false;
    }
    std::optional<LockedFile> file = LockedFile::open(path_, true);
    if (!file) {
        OVRA_WARN("Failed to open cache file [%s]", path_.c_str());
        return false;
    }
    const auto failed = [this](const char *what) {
        OVRA_WARN("Failed to %s cache file [%s]: %s", what, path_.c_str(),
                  OvraBase::errnoText(errno).c_str());
        return false;
    };
    const std::int64_t oldest = now - kKeepStale;
    Pair pair;
    if (!file->load(entry.name, pair)) {
        return failed("read");
    }
    if (younger == Younger::kKeep && file->copy() != nullptr) {
        const std::optional<CacheEntry> stored = BucketImage::find(file->copy(), entry.name);
        if (stored && stored->end > entry.end && stored->end <= now) {
            return true;
        }
    }
    BucketImage image = file->image();
    bool fits = compose(*file, entry, oldest, image);
    while (!fits && file->grow(path_, oldest)) {
        if (!file->load(entry.name, pair)) {
            return failed("read");
        }
        fits = compose(*file, entry, oldest, image);
    }
    if (!fits) { // evict the oldest
        image = file->image();
        image.add(entry);
        for (const CacheEntry &other : newestFirst(file->copy(), entry.name)) {
            image.add(other);
        }
    }
    return file->store(image) || failed("write");
}

bool CacheFile::remove(std::string_view name) const {
    if (!checkCacheFolder(OvraBase::folderOf(path_), false)) {
        return true;
    }
    std::optional<LockedFile> file = LockedFile::open(path_, false);
    if (!file) {
        return access(path_.c_str(), F_OK) != 0;
    }
    Pair pair;
    if (!file->load(name, pair)) {
        return false;
    }
    if (file->copy() == nullptr || !BucketImage::find(file->copy(), name)) {
        return true;
    }
    BucketImage image = file->image();
    image.copyFrom(file->copy(), name, INT64_MIN / 2);
    return file->store(image);
}

} // namespace OvraDRCore
