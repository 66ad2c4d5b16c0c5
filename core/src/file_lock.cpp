// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/file_lock.h"

#include "ovradrcore/log.h"
#include "ovradrcore/util.h"

#include <ovrabase/file.h>
#include <ovrabase/lock.h>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <string>

namespace OvraDRCore {

namespace {

using std::chrono::steady_clock;

constexpr const char *kLockDir = "/run/lock";
constexpr mode_t kMode = 0600;
constexpr mode_t kDirMode = 0755;

/// Opens a lock file without following links or waiting for the other end of a FIFO.
void openLockFile(const std::string &path, ForkClosedFd &fd) {
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    const NoFork noFork;
    fd.reset(open(path.c_str(), kFlags));
    // Without O_CREAT first: in a sticky folder the kernel may refuse O_CREAT on a file of another
    // user (fs.protected_regular), and it has to be told apart from one that is missing.
    if (!fd && errno == ENOENT) {
        fd.reset(open(path.c_str(), kFlags | O_CREAT | O_EXCL, kMode));
        if (fd) {
            (void)!fchmod(fd.get(), kMode); // regardless of the umask
        }
    }
}

/// Whether nobody else can hold this file's lock: to open it is all that flock(2) takes.
bool isOursAlone(const struct stat &status) {
    return S_ISREG(status.st_mode) && status.st_uid == geteuid() && status.st_nlink == 1 &&
           (status.st_mode & (S_IRWXG | S_IRWXO)) == 0;
}

/// Whether `path` still names the open file.
bool isNamed(const std::string &path, int fd) {
    struct stat named {};
    struct stat opened {};
    return lstat(path.c_str(), &named) == 0 && fstat(fd, &opened) == 0 &&
           named.st_dev == opened.st_dev && named.st_ino == opened.st_ino;
}

/// Puts `file` at `path`. Whoever put something there cannot put it there again in between.
bool putInPlace(const std::string &file, const std::string &path) {
    if (renameat2(AT_FDCWD, file.c_str(), AT_FDCWD, path.c_str(), RENAME_EXCHANGE) == 0) {
        // A folder may be full of anything: it stays under its new name.
        return unlink(file.c_str()) == 0 || errno == EISDIR;
    }
    // A file system without that. Only for a folder this takes two steps.
    return rename(file.c_str(), path.c_str()) == 0 ||
           (errno == EISDIR && rename(path.c_str(), (path + "." + GenerateUUID()).c_str()) == 0 &&
            rename(file.c_str(), path.c_str()) == 0);
}

/// Makes an empty file, regardless of the umask.
bool makeFile(const std::string &path) {
    const OvraBase::UniqueFd fd(
        open(path.c_str(), O_RDONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kMode));
    return fd && fchmod(fd.get(), kMode) == 0;
}

/// Replaces what is not a lock file of ours, if it is still there.
bool replaceForeign(const std::string &path) {
    // Two processes that replace it at once would take away each other's new file. Not longer than
    // a moment: everybody may lock the folder as well.
    const OvraBase::UniqueFd folder(
        open(OvraBase::folderOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const auto alone = OvraBase::lockFile(folder.get(), LOCK_EX, std::chrono::seconds(1));
    struct stat status {};
    bool gone = lstat(path.c_str(), &status) != 0 || isOursAlone(status);
    if (!gone) {
        const std::string aside = path + "." + GenerateUUID();
        gone = makeFile(aside) && putInPlace(aside, path);
        if (gone) {
            OVRA_WARN("Lock file [%s] was not a file of user %u alone: it is replaced",
                      path.c_str(), static_cast<unsigned int>(geteuid()));
        } else {
            OVRA_ERR("Lock file [%s] is not a file of user %u alone and cannot be replaced (%s). "
                     "Remove it",
                     path.c_str(), static_cast<unsigned int>(geteuid()),
                     OvraBase::errnoText(errno).c_str());
            unlink(aside.c_str());
        }
    }
    if (alone) {
        OvraBase::unlockFile(folder.get());
    }
    return gone;
}

/// After a lock file could not be used: whether it is worth another try.
/// \param error  the errno of opening it; 0 if that went well
bool makeWay(const std::string &path, int error) {
    switch (error) {
    case ENOENT:
        return OvraBase::folderOf(path) == kLockDir && File::CreateDir(kLockDir, kDirMode);
    case EEXIST: // another process was faster
        return true;
    case 0:
    case ELOOP:
    case ENXIO:
    case EACCES:
    case EPERM:
        return replaceForeign(path);
    default:
        OVRA_ERR("Cannot open lock file [%s]: %s", path.c_str(),
                 OvraBase::errnoText(error).c_str());
        return false;
    }
}

} // namespace

FileLock::FileLock(const std::string &path)
    : path_(path.find('/') == std::string::npos ? std::string(kLockDir) + "/" + path : path) {}

FileLock::~FileLock() {
    unlock();
}

bool FileLock::lock(int operation, unsigned int wait) {
    using std::chrono::milliseconds;
    const auto deadline = steady_clock::now() + std::chrono::seconds(wait);
    // Bounded, because somebody may put a file there again and again.
    constexpr int kMaxAttempts = 10;
    for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
        if (!fd_) {
            openLockFile(path_, fd_);
        }
        struct stat status {};
        if (!fd_ || fstat(fd_.get(), &status) != 0 || !isOursAlone(status)) {
            const int error = fd_ ? 0 : errno;
            fd_.reset();
            if (!makeWay(path_, error)) {
                return false;
            }
            continue;
        }
        const auto left = std::chrono::ceil<milliseconds>(deadline - steady_clock::now());
        if (!OvraBase::lockFile(fd_.get(), operation, std::max(left, milliseconds(0)))) {
            break;
        }
        if (isNamed(path_, fd_.get())) {
            return true;
        }
        unlock(); // it was replaced meanwhile
    }
    unlock();
    return false;
}

void FileLock::unlock() const {
    if (fd_) {
        OvraBase::unlockFile(fd_.get());
        fd_.reset();
    }
}

} // namespace OvraDRCore
