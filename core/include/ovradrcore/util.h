// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <sys/types.h>

#include <string>

namespace OvraDRCore {

/// A random UUID (version 4, RFC 9562) from the kernel's generator, in lower case; "" if the kernel
/// provides no random bytes.
[[nodiscard]] OVRADRCORE_EXPORT std::string GenerateUUID();

/// The decimal text of a value, without grouping in any locale. Only `int` is provided.
template <typename T>
std::string ToString(const T &value);
template <>
OVRADRCORE_EXPORT std::string ToString<int>(const int &value);

namespace File {

/// Creates `path` and its missing parent folders, each with exactly `mode`.
/// \return true if `path` is a directory afterwards; an existing one keeps its mode.
[[nodiscard]] OVRADRCORE_EXPORT bool CreateDir(const std::string &path, mode_t mode);

} // namespace File

} // namespace OvraDRCore
