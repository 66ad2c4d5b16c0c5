// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/lock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <thread>

namespace OvraBase {

namespace {

using std::chrono::microseconds;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

/// The pauses grow: a briefly held lock is acquired soon, and a long wait costs little.
constexpr microseconds kFirstPause{50};
constexpr microseconds kMaxPause{20'000};

/// Calls `attempt`, which returns like a system call, until it succeeds or the time-out expires.
template <typename Attempt>
Expected<void> keepTrying(milliseconds wait, Attempt attempt) {
    const auto deadline = steady_clock::now() + wait;
    for (microseconds pause = kFirstPause;; pause = std::min(pause * 2, kMaxPause)) {
        if (attempt() == 0) {
            return {};
        }
        const bool busy = errno == EAGAIN || errno == EACCES || errno == EINTR;
        if (!busy) {
            return lastSystemError();
        }
        const auto left = deadline - steady_clock::now();
        if (left <= left.zero()) {
            return systemError(ETIMEDOUT);
        }
        std::this_thread::sleep_for(std::min<steady_clock::duration>(pause, left));
    }
}

int setByteLock(int fd, off_t offset, short type) {
    struct flock range {};
    range.l_type = type;
    range.l_whence = SEEK_SET;
    range.l_start = offset;
    range.l_len = 1;
    return fcntl(fd, F_OFD_SETLK, &range);
}

} // namespace

Expected<void> lockFile(int fd, int operation, milliseconds wait) {
    return keepTrying(wait, [fd, operation] { return flock(fd, operation | LOCK_NB); });
}

void unlockFile(int fd) {
    flock(fd, LOCK_UN);
}

Expected<void> lockByte(int fd, off_t offset, milliseconds wait) {
    return keepTrying(wait, [fd, offset] { return setByteLock(fd, offset, F_WRLCK); });
}

void unlockByte(int fd, off_t offset) {
    setByteLock(fd, offset, F_UNLCK);
}

LockedFd &LockedFd::operator=(LockedFd &&other) noexcept {
    reset();
    fd_ = std::move(other.fd_);
    return *this;
}

LockedFd::~LockedFd() {
    reset();
}

Expected<LockedFd> LockedFd::lock(UniqueFd fd, int operation, milliseconds wait) {
    const Expected<void> locked = lockFile(fd.get(), operation, wait);
    if (!locked) {
        return Unexpected(locked.error());
    }
    return LockedFd(std::move(fd));
}

void LockedFd::reset() {
    if (fd_) {
        unlockFile(fd_.get());
        fd_.reset();
    }
}

} // namespace OvraBase
