// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/expected.h>

#include <cstddef>
#include <string>

// A secret key in a file of mode 0600: one line, its kind and the version of the format, and in
// base64url its bytes and their check. In version 1 there was no check.
namespace OvraPlatform {

/// The format of a kind of key file.
struct KeyFileKind {
    const char *name;   ///< e.g. "ovradr-seal"
    std::size_t size;   ///< bytes of the key
    const char *remedy; ///< what to do about a file that cannot be used, e.g. "restore it"
};

/// Reads the key. One that is not as it was written is refused: nothing else would tell it from a
/// different key.
/// \param key  takes `kind.size` bytes
[[nodiscard]] OvraBase::Expected<void> readKeyFile(const std::string &path, const KeyFileKind &kind,
                                                   unsigned char *key);

/// Creates the file atomically and durably. An existing one is kept, even if another process
/// creates it at the same time; that is not a failure.
[[nodiscard]] OvraBase::Expected<void>
createKeyFile(const std::string &path, const KeyFileKind &kind, const unsigned char *key);

} // namespace OvraPlatform
