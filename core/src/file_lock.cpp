// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/file_lock.h"

#include <ovrabase/lock.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>

namespace OvraDRCore {

namespace {

constexpr const char *kLockDir = "/run/lock/";

/// An existing file is opened without O_CREAT: in a sticky folder the kernel may refuse O_CREAT on
/// a file of another user (fs.protected_regular).
int openLockFile(const std::string &path) {
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    const int fd = open(path.c_str(), kFlags);
    if (fd >= 0 || errno != ENOENT) {
        return fd;
    }
    return open(path.c_str(), kFlags | O_CREAT, 0600);
}

} // namespace

FileLock::FileLock(const std::string &path)
    : path_(path.find('/') == std::string::npos ? kLockDir + path : path) {}

FileLock::~FileLock() {
    unlock();
}

bool FileLock::lock(int operation, unsigned int wait) {
    if (fd_ < 0) {
        fd_ = openLockFile(path_);
    }
    if (fd_ < 0) {
        return false;
    }
    const bool locked =
        static_cast<bool>(OvraBase::lockFile(fd_, operation, std::chrono::seconds(wait)));
    if (!locked) {
        unlock();
    }
    return locked;
}

void FileLock::unlock() const {
    if (fd_ >= 0) {
        OvraBase::unlockFile(fd_);
        close(fd_);
        fd_ = -1;
    }
}

} // namespace OvraDRCore
