// SPDX-License-Identifier: Apache-2.0
#include "provision/new_file.h"

#include <ovrabase/expected.h>

#include <sys/stat.h>

#include <cerrno>

namespace Ovradr {

Refusal fileFailure(const std::string &path, int error) {
    const bool denied = error == EACCES || error == EPERM;
    return failure(
        ExitCode::kNotSetUp, path + " cannot be used: " + OvraBase::errnoText(error) + ".",
        denied ? "Run the command as root." : "Correct that and run `ovradr setup` again.");
}

Expected<bool> makePrivate(const std::string &path) {
    struct stat status {};
    // What a link leads to is not ours to change.
    if (lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? Expected<bool>(false) : fileFailure(path, errno);
    }
    if (!S_ISREG(status.st_mode) || (status.st_mode & 077U) == 0) {
        return false;
    }
    if (chmod(path.c_str(), status.st_mode & 0700U) != 0) {
        return fileFailure(path, errno);
    }
    return true;
}

} // namespace Ovradr
