// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/no_fork.h"

#include <sys/types.h>

#include <string>

namespace OvraDRCore {

/// The right to refresh one entry, held by one RefreshLock on the appliance at a time: a byte of
/// the lock file next to the cache file, selected by the entry's name (fcntl(2), open file
/// description locks). It ends with its process, and a child of fork(2) does not have it.
///
/// It only saves work. Who cannot have it, because locks fail or because the holder hangs,
/// refreshes without it; nothing stored depends on it.
class RefreshLock {
public:
    enum class State { kHeld, kBusy, kUnavailable };

    RefreshLock(const std::string &path, const std::string &name);
    ~RefreshLock();
    RefreshLock(const RefreshLock &) = delete;
    RefreshLock &operator=(const RefreshLock &) = delete;

    /// \return kUnavailable, logged once per process, if locks do not work here.
    State tryAcquire();
    /// Leaves the lock file to a holder that hangs, and takes the lock in a new one unless another
    /// process has been faster. The other entries' refreshes may run twice this once.
    void takeOver();

private:
    int tryLock();
    void close();

    std::string path_;
    off_t offset_;
    ForkClosedFd file_;
};

} // namespace OvraDRCore
