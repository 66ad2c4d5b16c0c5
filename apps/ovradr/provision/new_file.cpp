// SPDX-License-Identifier: Apache-2.0
#include "provision/new_file.h"

#include <core/unique_fd.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace Ovradr {

namespace {

using OvraPlatform::UniqueFd;

/// Removes the file that is written aside.
class Aside {
public:
    explicit Aside(std::string path)
        : path_(std::move(path)) {}
    Aside(const Aside &) = delete;
    Aside &operator=(const Aside &) = delete;
    ~Aside() { unlink(path_.c_str()); }

private:
    std::string path_;
};

bool writeAll(int fd, std::string_view content) {
    while (!content.empty()) {
        const ssize_t count = write(fd, content.data(), content.size());
        if (count < 0 && errno != EINTR) {
            return false;
        }
        content.remove_prefix(count > 0 ? static_cast<std::size_t>(count) : 0);
    }
    return fsync(fd) == 0;
}

bool syncFolderOf(const std::string &path) {
    const std::string folder = std::filesystem::path(path).parent_path().string();
    const UniqueFd fd(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return fd && fsync(fd.get()) == 0;
}

} // namespace

Failure fileFailure(const std::string &path, int error) {
    const bool denied = error == EACCES || error == EPERM;
    return failure(ExitCode::kNotSetUp,
                   path + " cannot be used: " + std::system_category().message(error) + ".",
                   denied ? "Run the command as root."
                          : "Correct that and run `ovradr setup` again.");
}

Expected<bool> writeNewFile(const std::string &path, std::string_view content, mode_t mode) {
    if (access(path.c_str(), F_OK) == 0) {
        return false;
    }
    // Written aside and then linked: the file is complete when its name appears.
    std::string asidePath = path + ".XXXXXX";
    const UniqueFd fd(mkostemp(asidePath.data(), O_CLOEXEC));
    if (!fd) {
        return fileFailure(path, errno);
    }
    const Aside aside(asidePath);
    if (fchmod(fd.get(), mode) != 0 || !writeAll(fd.get(), content)) {
        return fileFailure(path, errno);
    }
    if (link(asidePath.c_str(), path.c_str()) != 0) {
        return errno == EEXIST ? Expected<bool>(false) : fileFailure(path, errno);
    }
    return syncFolderOf(path) ? Expected<bool>(true) : fileFailure(path, errno);
}

Expected<bool> makePrivate(const std::string &path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        return fileFailure(path, errno);
    }
    if ((status.st_mode & 077U) == 0) {
        return false;
    }
    if (chmod(path.c_str(), status.st_mode & 0700U) != 0) {
        return fileFailure(path, errno);
    }
    return true;
}

} // namespace Ovradr
