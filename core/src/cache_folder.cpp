// SPDX-License-Identifier: Apache-2.0
#include "cache_folder.h"

#include "ovradrcore/log.h"

#include <ovrabase/expected.h>

#include <fcntl.h>

#include <atomic>
#include <cerrno>
#include <filesystem>

namespace OvraDRCore {

namespace {

using OvraBase::UniqueFd;

bool refuse(const std::string &directory, const std::string &reason) {
    static std::atomic<bool> reported{false};
    if (!reported.exchange(true)) {
        OVRA_ERR("Cache directory [%s] %s; going on without a cache", directory.c_str(),
                 reason.c_str());
    }
    return false;
}

/// Opening a name failed because of what has it, not for want of a name, descriptors or space.
bool isInTheWay(int error) {
    return error == ELOOP || error == EISDIR || error == ENXIO || error == EACCES || error == EPERM;
}

bool discard(const std::string &path) {
    std::error_code error;
    std::filesystem::remove_all(path, error); // the link itself, never what it points to
    OVRA_WARN("Cache file [%s] is not a file of ours: %s", path.c_str(),
              error ? error.message().c_str() : "replacing it");
    return !error;
}

} // namespace

bool isOursAlone(const struct stat &status) {
    return status.st_uid == geteuid() && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

bool checkCacheFolder(const std::string &directory, bool create) {
    struct stat status {};
    if (lstat(directory.c_str(), &status) != 0) {
        if (errno == ENOENT && !create) {
            return false;
        }
        const bool made =
            errno == ENOENT && (mkdir(directory.c_str(), 0700) == 0 || errno == EEXIST);
        if (!made || lstat(directory.c_str(), &status) != 0) {
            return refuse(directory, "cannot be used: " + OvraBase::errnoText(errno));
        }
    }
    return (S_ISDIR(status.st_mode) && isOursAlone(status)) ||
           refuse(directory, "is not a directory of user " + std::to_string(geteuid()) +
                                 " that only he may write (remove it)");
}

UniqueFd openCacheFile(const std::string &path, int flags) {
    return UniqueFd(open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
}

UniqueFd openOrReplaceCacheFile(const std::string &path, int flags) {
    constexpr int kAttempts = 3; // another process may be replacing it as well
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        UniqueFd fd = openCacheFile(path, flags);
        if (!fd && !isInTheWay(errno)) {
            return fd;
        }
        struct stat status {};
        if (fd && fstat(fd.get(), &status) == 0 && S_ISREG(status.st_mode) && isOursAlone(status)) {
            return fd;
        }
        if (!discard(path)) {
            break;
        }
    }
    errno = EPERM;
    return {};
}

} // namespace OvraDRCore
