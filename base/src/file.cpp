// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <system_error>

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

/// Opens a regular file for reading; EINVAL for anything else.
Expected<UniqueFd> openRegular(const std::string &path, int flags, struct stat &status) {
    // Non-blocking, so that opening a FIFO in the file's place cannot hang.
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | flags));
    if (!fd || fstat(fd.get(), &status) != 0) {
        return lastSystemError();
    }
    if (!S_ISREG(status.st_mode)) {
        return systemError(EINVAL);
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
UniqueFd openLock(int folder) {
    constexpr int kFlags = O_RDONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    UniqueFd fd(openat(folder, ".lock", kFlags, 0600));
    // The owner of the folder must be able to open it even if the superuser was here first.
    struct stat status {};
    if (fd && geteuid() == 0 && fstat(folder, &status) == 0) {
        (void)!fchown(fd.get(), status.st_uid, status.st_gid);
    }
    return fd;
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

Expected<std::string> readFile(const std::string &path) {
    struct stat status {};
    const Expected<UniqueFd> fd = openRegular(path, 0, status);
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
    const Expected<UniqueFd> fd =
        openRegular(path, links == Links::kRefuse ? O_NOFOLLOW : 0, status);
    if (!fd) {
        return Unexpected(fd.error());
    }
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        return systemError(EPERM);
    }
    if (status.st_size < 0 || static_cast<std::size_t>(status.st_size) > kMaxTextFile) {
        return systemError(EFBIG);
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
    const UniqueFd folder(open(folderOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder && fsync(folder.get()) == 0 ? Expected<bool>(true) : lastSystemError();
}

Expected<FileUpdate> FileUpdate::begin(const std::string &path) {
    std::error_code failure;
    const std::filesystem::path target = std::filesystem::canonical(path, failure);
    const std::string resolved = failure ? path : target.string();
    UniqueFd folder(open(folderOf(resolved).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder) {
        return lastSystemError();
    }
    UniqueFd file = openLock(folder.get());
    if (!file) {
        return lastSystemError();
    }
    Expected<LockedFd> locked = LockedFd::lock(std::move(file), LOCK_EX, kLockWait);
    if (!locked) {
        return Unexpected(locked.error());
    }
    return FileUpdate(resolved, std::move(folder), std::move(*locked));
}

Expected<void> FileUpdate::commit(std::string_view content, mode_t modeWhenNew) const {
    mode_t mode = modeWhenNew;
    struct stat old {};
    const bool exists = stat(path_.c_str(), &old) == 0;
    if (exists && !S_ISREG(old.st_mode)) {
        return systemError(EINVAL);
    }
    const std::string temporaryPath = path_ + ".new";
    unlink(temporaryPath.c_str());
    UniqueFd fd(
        open(temporaryPath.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!fd) {
        return lastSystemError();
    }
    TemporaryFile temporary(temporaryPath);
    if (exists) {
        mode = old.st_mode & 07777U;
        // Only the superuser can change the owner; for others the file becomes their own.
        if (fchown(fd.get(), old.st_uid, old.st_gid) != 0 && errno != EPERM) {
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
