// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <cstddef>
#include <string>

// A secret key in a file of mode 0600: one line, a heading that says which kind it is, and the
// bytes in base64url.
namespace OvraPlatform {

/// What a kind of key file looks like.
struct KeyFileKind {
    const char *heading;
    std::size_t size;   ///< bytes of the key
    const char *remedy; ///< what to do about a damaged file, e.g. "restore it"
};

/// Reads the key.
/// \param key  takes `kind.size` bytes
[[nodiscard]] OvraBase::Expected<void> readKeyFile(const std::string &path, const KeyFileKind &kind,
                                                   unsigned char *key);

/// Makes the file, whole and durable. One that is there stays as it is, even if another process
/// makes it at the same time; that is no failure.
[[nodiscard]] OvraBase::Expected<void>
createKeyFile(const std::string &path, const KeyFileKind &kind, const unsigned char *key);

} // namespace OvraPlatform
