// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovrabase/expected.h"
#include "ovrabase/lock.h"
#include "ovrabase/secret.h"
#include "ovrabase/unique_fd.h"

#include <sys/stat.h>
#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

// Small files, read and written as a whole. Errors carry the errno of the failed call.
namespace OvraBase {

/// The largest file that the functions below accept, in bytes. Our settings and lists are far
/// smaller.
inline constexpr std::size_t kMaxTextFile = 1UL << 20U;

/// The parent folder of a path; "." for a bare name.
std::string folderOf(const std::string &path);

/// Synchronises the parent folder: a name made or removed there stays so after a power failure.
[[nodiscard]] Expected<void> syncFolderOf(const std::string &path);

/// Whether a file of this owner may be relied on: the superuser's, our own user's, or that of whom
/// its folder belongs to, who could replace it anyway.
bool isTrustedOwner(const std::string &path, uid_t owner);

/// Whether it is a regular file of a trusted owner to which not everybody may write.
/// \return EINVAL or EPERM otherwise
Expected<void> judgeFile(const std::string &path, const struct stat &status);

/// What to do if the last component of a path is a symbolic link.
enum class Links { kFollow, kRefuse };

/// Reads a whole file that judgeFile() accepts. Never blocks on anything else in its place, such as
/// a FIFO.
/// \return EFBIG for a file over kMaxTextFile bytes, EINVAL if it is not a regular file, EPERM if
///         others could have written it, ELOOP for a refused link
[[nodiscard]] Expected<std::string> readFile(const std::string &path, Links links = Links::kFollow);

/// As readFile(), for a file that only its owner can read.
/// \return EPERM if others can read it
[[nodiscard]] Expected<Secret> readPrivateFile(const std::string &path, Links links);

/// Creates a file atomically and durably unless it exists: an existing one is never replaced, even
/// if another process creates it at the same time.
/// \param mode  regardless of the umask
/// \return whether this call created it.
[[nodiscard]] Expected<bool> createFile(const std::string &path, std::string_view content,
                                        mode_t mode);

/// Opens /dev/null for each of the descriptors 0, 1 and 2 that is closed, so that no file or socket
/// that is opened later gets one of them, and with it what is meant for a person. For the first
/// line of main(). What was closed stays unusable: the standard input cannot be read, nor the
/// others written.
void fillStandardDescriptors();

/// One read-modify-write of a small file, exclusive among all processes and threads that use this
/// class for files in the same directory: the lock is flock(2) on the file ".lock" there, which
/// only the directory's owner can open, and is released when the process dies. Readers take no
/// lock; they see the old file or the new one. A process that dies in between leaves at most
/// PATH.new behind, which the next change overwrites.
class FileUpdate {
public:
    /// Takes the lock; waits at most 5 seconds for it.
    /// \return ETIMEDOUT if another process kept the lock; an error that names the lock file if
    ///         something else has its place.
    [[nodiscard]] static Expected<FileUpdate> begin(const std::string &path);

    /// Replaces the file by `content`, durably. Mode, without the right of others to write, and,
    /// where permitted, a trusted owner of the old file are kept.
    /// \param modeWhenNew  mode of a file that did not exist, regardless of the umask
    /// \return ELOOP for a symbolic link, which is neither followed nor replaced, and EINVAL for
    ///         anything else that is no file; on failure the old file is unchanged (or, if the
    ///         directory could not be synchronised, may return after a power failure).
    [[nodiscard]] Expected<void> commit(std::string_view content, mode_t modeWhenNew) const;

private:
    FileUpdate(std::string path, UniqueFd directory, LockedFd lock)
        : path_(std::move(path))
        , directory_(std::move(directory))
        , lock_(std::move(lock)) {}

    std::string path_;
    UniqueFd directory_;
    LockedFd lock_;
};

} // namespace OvraBase
