// SPDX-License-Identifier: Apache-2.0
#include "core/secret_file.h"

#include "core/file_update.h"
#include "core/unique_fd.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

namespace OvraPlatform {

namespace {

constexpr std::size_t kLargestFile = 256;

bool writeAll(int fd, const std::string &text) {
    return write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) &&
           fsync(fd) == 0;
}

void syncFolderOf(const std::string &path) {
    const UniqueFd folder(open(path.substr(0, path.find_last_of('/') + 1).c_str(),
                               O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (folder) {
        fsync(folder.get());
    }
}

} // namespace

bool readSecretFile(const std::string &path, std::string &text, std::string &why) {
    const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    struct stat status {};
    if (!fd || fstat(fd.get(), &status) != 0) {
        why = "cannot read " + path + ": " + errnoText(errno);
        return false;
    }
    if (!S_ISREG(status.st_mode) || (status.st_mode & 077U) != 0) {
        why = path + " must be a file that only its owner can read: chmod 600, and make a new key "
                     "if others may have read it";
        return false;
    }
    text.assign(kLargestFile, '\0');
    const ssize_t size = read(fd.get(), text.data(), text.size());
    text.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
    return true;
}

bool makeSecretFile(const std::string &path, const std::string &text, std::string &why) {
    // Written aside and then linked: the file is complete when its name appears, and a name that
    // another process has made meanwhile is not replaced.
    std::string aside = path + ".XXXXXX";
    const UniqueFd fd(mkostemp(aside.data(), O_CLOEXEC));
    if (!fd) {
        why = "cannot make " + path + ": " + errnoText(errno);
        return false;
    }
    const bool linked =
        writeAll(fd.get(), text) && (link(aside.c_str(), path.c_str()) == 0 || errno == EEXIST);
    if (!linked) {
        why = "cannot write " + path + ": " + errnoText(errno);
    }
    unlink(aside.c_str());
    if (linked) {
        syncFolderOf(path);
    }
    return linked;
}

} // namespace OvraPlatform
