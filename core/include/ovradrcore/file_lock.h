// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"
#include "ovradrcore/no_fork.h"

#include <string>

namespace OvraDRCore {

/// An advisory lock between processes, flock(2) on a dedicated file.
///
/// A bare name lives under /run/lock, which is created if missing; a name with a slash is a path.
/// The file is created if missing (mode 0600) and never removed, so that every process uses the
/// same one. Only a regular file of our own user with that mode and no other name is locked: what
/// anybody else put in its place (a file, a link, a FIFO, a folder) is replaced, with one line in
/// the log, or, where that is not permitted, refused. The lock belongs to this object, not to the
/// process, so two objects exclude each other within one process as well; it is released when the
/// process dies. A forked child does not hold the locks of its parent.
class OVRADRCORE_EXPORT FileLock {
public:
    /// Binds the object to its file; takes no lock.
    explicit FileLock(const std::string &path);
    /// Releases a lock still held.
    ~FileLock();
    FileLock(const FileLock &) = delete;
    FileLock &operator=(const FileLock &) = delete;

    /// Takes the lock; one that this object already holds is converted.
    /// \param operation  the bits of flock(2): LOCK_SH or LOCK_EX, with or without LOCK_NB
    /// \param wait       seconds to keep trying, on the monotonic clock; 0 tries once
    /// \return true if held.
    [[nodiscard]] bool lock(int operation, unsigned int wait);
    void unlock() const;

private:
    std::string path_;
    mutable ForkClosedFd fd_;
};

} // namespace OvraDRCore
