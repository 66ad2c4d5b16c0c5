// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <sys/types.h>

#include <string>

namespace OvraDRCore {

/// A random UUID (version 4, RFC 9562) from the kernel's generator, in lower case; "" when the
/// kernel gives no random bytes.
[[nodiscard]] OVRADRCORE_EXPORT std::string GenerateUUID();

/// The text of a value as a default string stream writes it. Only `int` is provided.
template <typename T>
std::string ToString(const T &value);
template <>
OVRADRCORE_EXPORT std::string ToString<int>(const int &value);

namespace File {

/// Makes `path` and the folders above it that are missing, each with exactly `mode`.
/// \return true when `path` is a directory afterwards; one that exists keeps its mode.
[[nodiscard]] OVRADRCORE_EXPORT bool CreateDir(const std::string &path, mode_t mode);

} // namespace File

} // namespace OvraDRCore
