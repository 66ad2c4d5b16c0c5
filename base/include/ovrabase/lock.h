// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovrabase/expected.h"
#include "ovrabase/unique_fd.h"

#include <sys/types.h>

#include <chrono>

// Advisory locks with a time-out. They are released explicitly: a child forked while one is held
// shares the open file description, so closing alone would not release the lock.
namespace OvraBase {

/// Takes flock(2) on an open file, or converts a held lock.
/// \param operation  LOCK_SH or LOCK_EX; LOCK_NB changes nothing
/// \param wait       how long to keep trying, on the monotonic clock; 0 tries once
/// \return ETIMEDOUT if another open file description keeps the lock.
[[nodiscard]] Expected<void> lockFile(int fd, int operation, std::chrono::milliseconds wait);
void unlockFile(int fd);

/// As lockFile() for an exclusive lock on one byte of the file (an open file description lock,
/// fcntl(2), F_OFD_SETLK). The file must be open for writing.
[[nodiscard]] Expected<void> lockByte(int fd, off_t offset, std::chrono::milliseconds wait);
void unlockByte(int fd, off_t offset);

/// An open file locked with flock(2); unlocking and closing go together.
class LockedFd {
public:
    LockedFd() = default;
    LockedFd(LockedFd &&) noexcept = default;
    LockedFd &operator=(LockedFd &&other) noexcept;
    LockedFd(const LockedFd &) = delete;
    LockedFd &operator=(const LockedFd &) = delete;
    ~LockedFd();

    /// As lockFile(), taking ownership of the file.
    [[nodiscard]] static Expected<LockedFd> lock(UniqueFd fd, int operation,
                                                 std::chrono::milliseconds wait);

    int get() const { return fd_.get(); }
    explicit operator bool() const { return static_cast<bool>(fd_); }
    /// Unlocks and closes.
    void reset();

private:
    explicit LockedFd(UniqueFd fd)
        : fd_(std::move(fd)) {}

    UniqueFd fd_;
};

} // namespace OvraBase
