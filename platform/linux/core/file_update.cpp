// SPDX-License-Identifier: Apache-2.0
#include "core/file_update.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <system_error>
#include <thread>

namespace OvraPlatform {

namespace {

constexpr std::chrono::seconds kLockWait{5};
constexpr std::chrono::milliseconds kLockPause{10};

int lockWithin(int fd, std::chrono::milliseconds wait) {
    const auto deadline = std::chrono::steady_clock::now() + wait;
    while (flock(fd, LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            return errno;
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            return ETIMEDOUT;
        }
        std::this_thread::sleep_for(kLockPause);
    }
    return 0;
}

int writeAll(int fd, const std::string &content) {
    std::size_t done = 0;
    while (done < content.size()) {
        const ssize_t count = write(fd, content.data() + done, content.size() - done);
        if (count < 0 && errno != EINTR) {
            return errno;
        }
        done += count > 0 ? static_cast<std::size_t>(count) : 0;
    }
    return 0;
}

} // namespace

std::string errnoText(int error) {
    return std::generic_category().message(error);
}

int readTextFile(const std::string &path, std::string &text) {
    // Not blocking, so that a pipe in the file's place cannot hold us up.
    const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!fd) {
        return errno;
    }
    struct stat status {};
    if (fstat(fd.get(), &status) != 0) {
        return errno;
    }
    if (!S_ISREG(status.st_mode)) {
        return EINVAL;
    }
    std::string content;
    std::array<char, 8192> block{};
    while (true) {
        const ssize_t count = read(fd.get(), block.data(), block.size());
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return errno;
        }
        if (count == 0) {
            break;
        }
        content.append(block.data(), static_cast<std::size_t>(count));
        if (content.size() > kMaxTextFile) {
            return EFBIG;
        }
    }
    text = std::move(content);
    return 0;
}

FileUpdate::FileUpdate(const std::string &path) {
    std::error_code failure;
    const std::filesystem::path target = std::filesystem::canonical(path, failure);
    path_ = failure ? path : target.string();
    std::filesystem::path folder = std::filesystem::path(path_).parent_path();
    if (folder.empty()) {
        folder = ".";
    }
    directory_.reset(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    error_ = directory_ ? lockWithin(directory_.get(), kLockWait) : errno;
}

FileUpdate::~FileUpdate() {
    if (directory_ && error_ == 0) {
        // Closing is not enough when the process has forked meanwhile: the child has the lock too.
        flock(directory_.get(), LOCK_UN);
    }
}

int FileUpdate::writeNew(const std::string &newPath, const std::string &content,
                         mode_t modeWhenNew) const {
    mode_t mode = modeWhenNew;
    struct stat old {};
    const bool exists = stat(path_.c_str(), &old) == 0;
    if (exists && !S_ISREG(old.st_mode)) {
        return EINVAL;
    }
    UniqueFd fd(open(newPath.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!fd) {
        return errno;
    }
    if (exists) {
        mode = old.st_mode & 07777U;
        // Only the superuser can give files away; for others the file becomes their own.
        if (fchown(fd.get(), old.st_uid, old.st_gid) != 0 && errno != EPERM) {
            return errno;
        }
    }
    if (const int error = writeAll(fd.get(), content); error != 0) {
        return error;
    }
    if (fchmod(fd.get(), mode) != 0 || fsync(fd.get()) != 0) {
        return errno;
    }
    return close(fd.release()) == 0 ? 0 : errno;
}

int FileUpdate::commit(const std::string &content, mode_t modeWhenNew) const {
    if (error_ != 0) {
        return error_;
    }
    const std::string newPath = path_ + ".new";
    unlink(newPath.c_str());
    int error = writeNew(newPath, content, modeWhenNew);
    if (error == 0 && rename(newPath.c_str(), path_.c_str()) != 0) {
        error = errno;
    }
    if (error != 0) {
        unlink(newPath.c_str());
        return error;
    }
    return fsync(directory_.get()) == 0 ? 0 : errno;
}

} // namespace OvraPlatform
