// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/export.h"
#include "core/unique_fd.h"

#include <sys/types.h>

#include <cstddef>
#include <string>

namespace OvraPlatform {

/// The largest file that the functions below take, in bytes. Settings and lists of ours are far
/// smaller; what is larger is not one of them.
inline constexpr std::size_t kMaxTextFile = 1UL << 20U;

/// Reads a small regular file whole.
/// \return 0, or the errno that tells why not (EFBIG: larger than kMaxTextFile, EINVAL: not a
///         regular file); `text` is then unchanged.
OVRAPLATFORM_EXPORT int readTextFile(const std::string &path, std::string &text);

/// One read-modify-write of a small file, alone among all processes and threads that use this class
/// for files of the same directory: the lock is flock(2) on the directory and goes with the
/// process. Readers take no lock, they see the old file or the new one. A process that dies in
/// between leaves at most PATH.new behind, which the next change overwrites.
class OVRAPLATFORM_EXPORT FileUpdate {
public:
    /// Takes the lock; waits at most 5 seconds for it. A symbolic link at `path` is followed.
    explicit FileUpdate(const std::string &path);
    FileUpdate(const FileUpdate &) = delete;
    FileUpdate &operator=(const FileUpdate &) = delete;
    ~FileUpdate();

    /// 0 when the lock is held, otherwise the errno that tells why not (ETIMEDOUT: another process
    /// kept it).
    int error() const { return error_; }

    /// Replaces the file by `content`, durable when this returns. Mode and, where that is allowed,
    /// owner of the old file are kept.
    /// \param modeWhenNew  mode of a file that did not exist, whatever the umask
    /// \return 0, or an errno; the old file is then as it was (or, when the directory could not be
    ///         synchronised, is again after a power failure).
    int commit(const std::string &content, mode_t modeWhenNew) const;

private:
    int writeNew(const std::string &newPath, const std::string &content, mode_t modeWhenNew) const;

    std::string path_;
    UniqueFd directory_;
    int error_ = 0;
};

/// The system's words for an errno.
OVRAPLATFORM_EXPORT std::string errnoText(int error);

} // namespace OvraPlatform
