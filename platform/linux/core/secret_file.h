// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/export.h"

#include <string>

namespace OvraPlatform {

/// Reads a small file that only its owner can read: a regular one, no link, of at most 256 bytes.
/// \param text  takes the content; the caller wipes it
/// \param why   takes one sentence when the result is false
bool readSecretFile(const std::string &path, std::string &text, std::string &why);

/// Makes such a file, mode 0600, whole and durable. One that is there is not replaced, also when
/// another process makes it at the same time; that is no failure.
/// \param why  takes one sentence when the result is false
bool makeSecretFile(const std::string &path, const std::string &text, std::string &why);

} // namespace OvraPlatform
