// SPDX-License-Identifier: Apache-2.0
#include "cache_folder.h"

#include "ovradrcore/cache_folder.h"
#include "ovradrcore/log.h"
#include "ovradrcore/util.h"

#include <ovrabase/expected.h>

#include <fcntl.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <filesystem>

namespace OvraDRCore {

namespace {

using OvraBase::UniqueFd;

std::atomic<bool> &makesFolders() {
    static std::atomic<bool> makes{true};
    return makes;
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

/// What is in it was not made by us: nothing of it is used, and nothing is done to it.
bool moveAway(const std::string &directory) {
    const std::string aside = directory + "." + GenerateUUID();
    const bool moved = rename(directory.c_str(), aside.c_str()) == 0;
    if (moved) {
        OVRA_WARN("Cache directory [%s] was not one that only user %u may write: it is [%s] now",
                  directory.c_str(), static_cast<unsigned int>(geteuid()), aside.c_str());
    }
    return moved;
}

constexpr const char *kMissing = "is missing";

/// "" if the directory may be trusted; see checkCacheFolder().
std::string problemOf(const std::string &directory, bool create) {
    struct stat status {};
    constexpr int kAttempts = 3; // somebody may put another one there
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        if (lstat(directory.c_str(), &status) != 0) {
            if (errno == ENOENT && !create) {
                return kMissing;
            }
            // The umask may take rights of our own as well.
            const bool made =
                errno == ENOENT &&
                ((mkdir(directory.c_str(), 0700) == 0 && chmod(directory.c_str(), 0700) == 0) ||
                 errno == EEXIST);
            if (!made || lstat(directory.c_str(), &status) != 0) {
                return "cannot be used: " + OvraBase::errnoText(errno);
            }
        }
        if (S_ISDIR(status.st_mode) && isOursAlone(status)) {
            return "";
        }
        if (!moveAway(directory)) {
            break;
        }
    }
    return "is not a directory of user " + std::to_string(geteuid()) +
           " that only he may write (remove it)";
}

} // namespace

std::string prepareCacheFolder(const std::string &directory) {
    return problemOf(directory, true);
}

void makeNoCacheFolder() {
    makesFolders() = false;
}

bool isOursAlone(const struct stat &status) {
    return status.st_uid == geteuid() && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0 &&
           (S_ISDIR(status.st_mode) || status.st_nlink <= 1);
}

bool checkCacheFolder(const std::string &directory, bool create) {
    const std::string problem = problemOf(directory, create && makesFolders());
    static std::atomic<bool> reported{false};
    if (!problem.empty() && problem != kMissing && !reported.exchange(true)) {
        OVRA_ERR("Cache directory [%s] %s; going on without a cache", directory.c_str(),
                 problem.c_str());
    }
    return problem.empty();
}

UniqueFd openCacheFile(const std::string &path, int flags) {
    UniqueFd fd(open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
    struct stat status {};
    if (fd && (flags & O_CREAT) != 0 && fstat(fd.get(), &status) == 0 && isOursAlone(status) &&
        (status.st_mode & 0777U) != 0600) {
        (void)!fchmod(fd.get(), 0600); // regardless of the umask
    }
    return fd;
}

UniqueFd openOrReplaceCacheFile(const std::string &path, int flags) {
    constexpr int kAttempts = 3; // another process may be replacing it as well
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        UniqueFd fd = openCacheFile(path, flags);
        if (!fd && !isInTheWay(errno)) {
            return fd;
        }
        struct stat status {};
        if (fd && fstat(fd.get(), &status) != 0) {
            return {};
        }
        if (fd && S_ISREG(status.st_mode) && isOursAlone(status)) {
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
