// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <cstddef>
#include <string>

// A secret key in a file of mode 0600: one line, a heading that names its kind, and the bytes in
// base64url.
namespace OvraPlatform {

/// The format of a kind of key file.
struct KeyFileKind {
    const char *heading;
    std::size_t size;   ///< bytes of the key
    const char *remedy; ///< what to do about a damaged file, e.g. "restore it"
};

/// Reads the key.
/// \param key  takes `kind.size` bytes
[[nodiscard]] OvraBase::Expected<void> readKeyFile(const std::string &path, const KeyFileKind &kind,
                                                   unsigned char *key);

/// Creates the file atomically and durably. An existing one is kept, even if another process
/// creates it at the same time; that is not a failure.
[[nodiscard]] OvraBase::Expected<void>
createKeyFile(const std::string &path, const KeyFileKind &kind, const unsigned char *key);

} // namespace OvraPlatform
