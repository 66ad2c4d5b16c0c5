// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdlib>

namespace OvraBase {

namespace {

constexpr std::chrono::seconds kLockWait{5};

/// Removes a temporary file unless it has been renamed.
class TemporaryFile {
public:
    explicit TemporaryFile(std::string path)
        : path_(std::move(path)) {}
    TemporaryFile(const TemporaryFile &) = delete;
    TemporaryFile &operator=(const TemporaryFile &) = delete;
    ~TemporaryFile() {
        if (!path_.empty()) {
            unlink(path_.c_str());
        }
    }

    /// Renames the file to `target`, replacing what is there.
    bool renameTo(const std::string &target) {
        const bool renamed = rename(path_.c_str(), target.c_str()) == 0;
        if (renamed) {
            path_.clear();
        }
        return renamed;
    }

private:
    std::string path_;
};

/// Opens a file for reading and judges it.
Expected<UniqueFd> openOwn(const std::string &path, Links links, struct stat &status) {
    // Non-blocking, so that opening a FIFO in the file's place cannot hang.
    constexpr int kFlags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    UniqueFd fd(open(path.c_str(), links == Links::kRefuse ? kFlags | O_NOFOLLOW : kFlags));
    if (!fd && errno == ELOOP) {
        return Unexpected({"it is a symbolic link, or one that leads nowhere", ELOOP});
    }
    if (!fd || fstat(fd.get(), &status) != 0) {
        return lastSystemError();
    }
    if (Expected<void> own = judgeFile(path, status); !own) {
        return Unexpected(own.error());
    }
    if (status.st_size < 0 || static_cast<std::size_t>(status.st_size) > kMaxTextFile) {
        return Unexpected({"it is too large", EFBIG});
    }
    return fd;
}

/// Calls `take` with each chunk of the file.
template <typename Take>
Expected<void> readParts(int fd, Take take) {
    std::array<char, 8192> part{};
    std::size_t total = 0;
    while (true) {
        const ssize_t count = read(fd, part.data(), part.size());
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            const Unexpected failure = lastSystemError();
            explicit_bzero(part.data(), part.size());
            return count == 0 ? Expected<void>() : failure;
        }
        total += static_cast<std::size_t>(count);
        if (total > kMaxTextFile) {
            return systemError(EFBIG);
        }
        take(std::string_view(part.data(), static_cast<std::size_t>(count)));
    }
}

Expected<void> writeAndSync(int fd, std::string_view content, mode_t mode) {
    while (!content.empty()) {
        const ssize_t count = write(fd, content.data(), content.size());
        if (count < 0 && errno != EINTR) {
            return lastSystemError();
        }
        content.remove_prefix(count > 0 ? static_cast<std::size_t>(count) : 0);
    }
    return fchmod(fd, mode) == 0 && fsync(fd) == 0 ? Expected<void>() : lastSystemError();
}

/// Opens the file that stands for a folder's lock. The folder itself would not do: to open it for
/// reading, as everybody may, is all that flock(2) takes.
Expected<UniqueFd> openLock(const std::string &folderPath, int folder) {
    constexpr int kFlags = O_RDONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    const std::string path = folderPath + "/.lock";
    UniqueFd fd(openat(folder, ".lock", kFlags, 0600));
    struct stat status {};
    struct stat owner {};
    if (!fd || fstat(fd.get(), &status) != 0 || fstat(folder, &owner) != 0) {
        const int number = errno;
        return Unexpected({path + " cannot be used: " + errnoText(number), number});
    }
    if (Expected<void> own = judgeFile(path, status); !own) {
        return Unexpected({path + " cannot be used: " + own.error().text, own.error().number});
    }
    // The owner of the folder must be able to open it even if the superuser was here first, under
    // whatever umask; and nobody else, who could hold it.
    if ((status.st_mode & 07777U) != 0600) {
        (void)!fchmod(fd.get(), 0600);
    }
    if (status.st_uid != owner.st_uid && geteuid() == 0) {
        (void)!fchown(fd.get(), owner.st_uid, owner.st_gid);
    }
    return fd;
}

/// Whether a file may be kept as it is, or replaced: it is judged, and a link is not followed.
/// \return whether there is one.
Expected<bool> judgeOld(const std::string &path, struct stat &status) {
    if (lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? Expected<bool>(false) : lastSystemError();
    }
    if (S_ISLNK(status.st_mode)) {
        return Unexpected({"it is a symbolic link: put the file itself there", ELOOP});
    }
    return S_ISREG(status.st_mode) ? Expected<bool>(true)
                                   : Unexpected({"it is not a regular file", EINVAL});
}

} // namespace

std::string folderOf(const std::string &path) {
    const std::size_t slash = path.find_last_of('/');
    if (slash == std::string::npos) {
        return ".";
    }
    const std::size_t end = path.find_last_not_of('/', slash);
    return end == std::string::npos ? "/" : path.substr(0, end + 1);
}

Expected<void> syncFolderOf(const std::string &path) {
    const UniqueFd folder(open(folderOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder && fsync(folder.get()) == 0 ? Expected<void>() : lastSystemError();
}

bool isTrustedOwner(const std::string &path, uid_t owner) {
    struct stat folder {};
    return owner == 0 || owner == geteuid() ||
           (stat(folderOf(path).c_str(), &folder) == 0 && folder.st_uid == owner);
}

Expected<void> judgeFile(const std::string &path, const struct stat &status) {
    if (!S_ISREG(status.st_mode)) {
        return Unexpected({"it is not a regular file", EINVAL});
    }
    if ((status.st_mode & S_IWOTH) != 0 || !isTrustedOwner(path, status.st_uid)) {
        return Unexpected({"it belongs to somebody else, or others may write to it", EPERM});
    }
    return {};
}

Expected<std::string> readFile(const std::string &path, Links links) {
    struct stat status {};
    const Expected<UniqueFd> fd = openOwn(path, links, status);
    if (!fd) {
        return Unexpected(fd.error());
    }
    std::string content;
    const Expected<void> whole =
        readParts(fd->get(), [&content](std::string_view part) { content += part; });
    if (!whole) {
        return Unexpected(whole.error());
    }
    return content;
}

Expected<Secret> readPrivateFile(const std::string &path, Links links) {
    struct stat status {};
    const Expected<UniqueFd> fd = openOwn(path, links, status);
    if (!fd) {
        return Unexpected(fd.error());
    }
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        return Unexpected({"others can read it", EPERM});
    }
    std::string content;
    const WipeAtEnd wiped(content);
    content.reserve(static_cast<std::size_t>(status.st_size));
    const Expected<void> whole = readParts(fd->get(), [&content](std::string_view part) {
        // A file that grows while being read is not ours, and reallocation must not leave copies
        // behind.
        content += part.substr(0, content.capacity() - content.size());
    });
    if (!whole) {
        return Unexpected(whole.error());
    }
    return Secret(content);
}

Expected<bool> createFile(const std::string &path, std::string_view content, mode_t mode) {
    if (access(path.c_str(), F_OK) == 0) {
        return false;
    }
    // Written under a temporary name and then linked: the file is complete when its name appears.
    std::string temporaryPath = path + ".XXXXXX";
    const UniqueFd fd(mkostemp(temporaryPath.data(), O_CLOEXEC));
    if (!fd) {
        return lastSystemError();
    }
    const TemporaryFile temporary(temporaryPath);
    const Expected<void> written = writeAndSync(fd.get(), content, mode);
    if (!written) {
        return Unexpected(written.error());
    }
    if (link(temporaryPath.c_str(), path.c_str()) != 0) {
        return errno == EEXIST ? Expected<bool>(false) : lastSystemError();
    }
    if (const Expected<void> synced = syncFolderOf(path); !synced) {
        return Unexpected(synced.error());
    }
    return true;
}

Expected<FileUpdate> FileUpdate::begin(const std::string &path) {
    const std::string folderPath = folderOf(path);
    UniqueFd folder(open(folderPath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder) {
        return lastSystemError();
    }
    Expected<UniqueFd> file = openLock(folderPath, folder.get());
    if (!file) {
        return Unexpected(file.error());
    }
    Expected<LockedFd> locked = LockedFd::lock(std::move(*file), LOCK_EX, kLockWait);
    if (!locked) {
        return Unexpected(locked.error());
    }
    return FileUpdate(path, std::move(folder), std::move(*locked));
}

Expected<void> FileUpdate::commit(std::string_view content, mode_t modeWhenNew) const {
    mode_t mode = modeWhenNew;
    struct stat old {};
    const Expected<bool> exists = judgeOld(path_, old);
    if (!exists) {
        return Unexpected(exists.error());
    }
    const std::string temporaryPath = path_ + ".new";
    unlink(temporaryPath.c_str());
    UniqueFd fd(
        open(temporaryPath.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!fd) {
        return lastSystemError();
    }
    TemporaryFile temporary(temporaryPath);
    if (*exists) {
        mode = old.st_mode & 0755U;
        // Only the superuser can change the owner; for others the file becomes their own.
        if (isTrustedOwner(path_, old.st_uid) && fchown(fd.get(), old.st_uid, old.st_gid) != 0 &&
            errno != EPERM) {
            return lastSystemError();
        }
    }
    if (Expected<void> written = writeAndSync(fd.get(), content, mode); !written) {
        return written;
    }
    if (close(fd.release()) != 0 || !temporary.renameTo(path_) || fsync(directory_.get()) != 0) {
        return lastSystemError();
    }
    return {};
}

void fillStandardDescriptors() {
    for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        // open(2) takes the lowest closed descriptor.
        if (fcntl(fd, F_GETFD) < 0) {
            static_cast<void>(open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY));
        }
    }
}

} // namespace OvraBase
