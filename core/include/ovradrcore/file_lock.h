// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <string>

namespace OvraDRCore {

/// An advisory lock between processes, flock(2) on a dedicated file.
///
/// A bare name lives under /run/lock; a name with a slash is a path. The file is created if missing
/// (mode 0600), never opened through a symbolic link, and never removed, so that every process uses
/// the same file. The lock belongs to this object, not to the process, so two objects exclude each
/// other within one process as well; it is released when the process dies.
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
    mutable int fd_ = -1;
};

} // namespace OvraDRCore
