// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/safe_path.h"

#include "ovrabase/file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <sstream>

namespace OvraBase {

namespace {

/// As many links as the kernel follows (path_resolution(7)).
constexpr int kMaxLinks = 40;
/// What the kernel shows for an owner that a user namespace does not know.
constexpr uid_t kOverflowUser = 65534;

bool namespaceKnows(uid_t user) {
    std::istringstream map(readFile("/proc/self/uid_map").value_or("0 0 4294967295"));
    std::uint64_t first = 0;
    std::uint64_t outside = 0;
    std::uint64_t count = 0;
    while (map >> first >> outside >> count) {
        if (user >= first && user - first < count) {
            return true;
        }
    }
    return false;
}

Expected<void> judge(const std::string &place, const struct stat &status) {
    const bool ours = status.st_uid == 0 || status.st_uid == geteuid() ||
                      (status.st_uid == kOverflowUser && !namespaceKnows(kOverflowUser));
    if (!ours) {
        return Unexpected({place + " belongs to user " + std::to_string(status.st_uid) +
                               ": give it to root, and see what was done there",
                           EPERM});
    }
    const bool groups =
        (status.st_mode & S_IWGRP) != 0 && status.st_gid != 0 && status.st_gid != getegid();
    const bool sticky = S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0;
    if (!S_ISLNK(status.st_mode) && !sticky && ((status.st_mode & S_IWOTH) != 0 || groups)) {
        return Unexpected(
            {"others may write to " + place + ": chmod go-w it, and see what was done there",
             EPERM});
    }
    return {};
}

std::string linkTarget(const std::string &place) {
    std::array<char, PATH_MAX> target{};
    const ssize_t size = readlink(place.c_str(), target.data(), target.size());
    return {target.data(), size > 0 ? static_cast<std::size_t>(size) : 0};
}

} // namespace

Expected<void> checkPathToRun(const std::string &path) {
    std::string done = "/";
    std::string rest = path;
    int links = 0;
    while (true) {
        struct stat status {};
        if (lstat(done.c_str(), &status) != 0) {
            return errno == ENOENT || errno == ENOTDIR ? Expected<void>() : lastSystemError();
        }
        if (auto judged = judge(done, status); !judged) {
            return judged;
        }
        if (S_ISLNK(status.st_mode)) {
            if (++links > kMaxLinks) {
                return Unexpected({path + " has too many links", ELOOP});
            }
            const std::string target = linkTarget(done);
            rest.insert(0, target + "/");
            done = target.starts_with('/') ? "/" : folderOf(done);
        }
        rest.erase(0, rest.find_first_not_of('/'));
        if (rest.empty()) {
            return {};
        }
        const std::string name = rest.substr(0, rest.find('/'));
        rest.erase(0, name.size());
        // What has been judged is no link: its parent is the folder that its path names.
        if (name == "..") {
            done = folderOf(done);
        } else if (name != ".") {
            done += (done == "/" ? "" : "/") + name;
        }
    }
}

} // namespace OvraBase
