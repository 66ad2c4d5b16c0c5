// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovrabase/expected.h"
#include "ovrabase/lock.h"
#include "ovrabase/secret.h"
#include "ovrabase/unique_fd.h"

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

// Small files, read and written whole. Errors carry the errno of the call that failed.
namespace OvraBase {

/// The largest file that the functions below take, in bytes. Settings and lists of ours are far
/// smaller; what is larger is not one of them.
inline constexpr std::size_t kMaxTextFile = 1UL << 20U;

/// The folder that a path lies in; "." for a bare name.
std::string folderOf(const std::string &path);

/// Reads a regular file whole. Whatever stands in its place instead, nothing is waited for.
/// \return EFBIG for a file over kMaxTextFile bytes, EINVAL for what is not a regular file.
[[nodiscard]] Expected<std::string> readFile(const std::string &path);

enum class Links { kFollow, kRefuse };

/// As readFile(), for a file that only its owner can read.
/// \param links  what to do about a symbolic link in the last place of the path
/// \return EPERM for one that others can read, ELOOP for a link that is refused
[[nodiscard]] Expected<Secret> readPrivateFile(const std::string &path, Links links);

/// Makes a file, whole and durable, unless it is there: an existing one is never replaced, also
/// when another process makes it at the same time. \param mode  whatever the umask is \return
/// whether this call made it.
[[nodiscard]] Expected<bool> createFile(const std::string &path, std::string_view content,
                                        mode_t mode);

/// One read-modify-write of a small file, alone among all processes and threads that use this class
/// for files of the same directory: the lock is flock(2) on the directory and goes with the
/// process. Readers take no lock, they see the old file or the new one. A process that dies in
/// between leaves at most PATH.new behind, which the next change overwrites.
class FileUpdate {
public:
    /// Takes the lock; waits at most 5 seconds for it. A symbolic link at `path` is followed.
    /// \return ETIMEDOUT when another process kept the lock.
    [[nodiscard]] static Expected<FileUpdate> begin(const std::string &path);

    /// Replaces the file by `content`, durable when this returns. Mode and, where that is allowed,
    /// owner of the old file are kept.
    /// \param modeWhenNew  mode of a file that did not exist, whatever the umask
    /// \return on failure the old file is as it was (or, when the directory could not be
    ///         synchronised, is again after a power failure).
    [[nodiscard]] Expected<void> commit(std::string_view content, mode_t modeWhenNew) const;

private:
    FileUpdate(std::string path, LockedFd directory)
        : path_(std::move(path))
        , directory_(std::move(directory)) {}

    std::string path_;
    LockedFd directory_;
};

} // namespace OvraBase
