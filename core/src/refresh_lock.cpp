// SPDX-License-Identifier: Apache-2.0
#include "refresh_lock.h"

#include "cache_bucket.h"
#include "cache_folder.h"
#include "ovradrcore/log.h"

#include <ovrabase/expected.h>
#include <ovrabase/file.h>
#include <ovrabase/lock.h>

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

namespace OvraDRCore {

RefreshLock::RefreshLock(const std::string &path, const std::string &name)
    : path_(path + ".lock")
    , offset_(static_cast<off_t>(cacheNameHash(name) >> 2U)) {} // positive, with room after it

RefreshLock::~RefreshLock() {
    close();
}

void RefreshLock::close() {
    if (file_) {
        OvraBase::unlockByte(file_.get(), offset_);
        file_.reset();
    }
}

/// \return 0 or an errno; EAGAIN if another one holds the lock.
int RefreshLock::tryLock() {
    const NoFork noFork;
    constexpr int kAttempts = 100; // another process may replace the file at every one
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        if (!file_) {
            OvraBase::UniqueFd opened = openOrReplaceCacheFile(path_, O_RDWR | O_CREAT);
            if (!opened) {
                return errno;
            }
            file_.reset(opened.release());
        }
        const auto locked = OvraBase::lockByte(file_.get(), offset_, {});
        if (!locked) {
            return locked.error().number == ETIMEDOUT ? EAGAIN : locked.error().number;
        }
        struct stat status {};
        if (fstat(file_.get(), &status) == 0 && status.st_nlink != 0) {
            return 0;
        }
        close();
    }
    return EAGAIN;
}

RefreshLock::State RefreshLock::tryAcquire() {
    if (!checkCacheFolder(OvraBase::folderOf(path_), true)) {
        return State::kUnavailable;
    }
    const int error = tryLock();
    if (error == 0 || error == EAGAIN) {
        return error == 0 ? State::kHeld : State::kBusy;
    }
    static std::atomic<bool> reported{false};
    if (!reported.exchange(true)) {
        OVRA_WARN("Failed to lock [%s]: %s; several processes may refresh the same cache entry",
                  path_.c_str(), OvraBase::errnoText(error).c_str());
    }
    return State::kUnavailable;
}

void RefreshLock::takeOver() {
    struct stat ours {};
    struct stat named {};
    const bool current = file_ && fstat(file_.get(), &ours) == 0 &&
                         lstat(path_.c_str(), &named) == 0 && ours.st_dev == named.st_dev &&
                         ours.st_ino == named.st_ino;
    if (current) {
        unlink(path_.c_str());
    }
    close();
    tryAcquire();
}

} // namespace OvraDRCore
