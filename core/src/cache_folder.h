// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/unique_fd.h>

#include <sys/stat.h>

#include <string>

// What may be used in the directory of the cache files: /tmp is everybody's.
namespace OvraDRCore {

/// Belongs to this user, nobody else can write to it, and, if a file, it has no other name.
bool isOursAlone(const struct stat &status);

/// Whether the directory may be trusted. Nobody else can replace it between this check and the
/// opening of a file in it: its parent folder is sticky or ours. One that is not ours alone is
/// moved away, where that is permitted. Why it cannot be used is logged once per process.
/// \param create  make a missing one, mode 0700
bool checkCacheFolder(const std::string &directory, bool create);

/// open(2) that never follows a link, never blocks on a FIFO and never passes to another program.
OvraBase::UniqueFd openCacheFile(const std::string &path, int flags);

/// As openCacheFile() for a writer: whatever else has the name (a link, a FIFO, a folder, a file
/// that others may write) is removed with a log line.
/// \return a regular file of ours alone; none, with errno, if there is none.
OvraBase::UniqueFd openOrReplaceCacheFile(const std::string &path, int flags);

} // namespace OvraDRCore
