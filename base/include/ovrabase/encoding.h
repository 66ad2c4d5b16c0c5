// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

// Texts for bytes, by libsodium. The functions that hash need sodiumReady() first.
namespace OvraBase {

/// Makes libsodium ready; true when it is. Cheap to repeat, in any thread.
bool sodiumReady();

/// Base64 with the alphabet that is safe in URLs, unpadded (RFC 4648, section 5).
std::string toBase64Url(const unsigned char *data, std::size_t size);
/// Nothing when the text is anything else.
std::optional<std::vector<unsigned char>> fromBase64Url(const std::string &text);

/// "SHA256:" and the unpadded base64 (RFC 4648, section 4) of the SHA-256 of the bytes, the form in
/// which people know fingerprints from ssh-keygen(1).
std::string fingerprintOf(const unsigned char *data, std::size_t size);
/// Whether the text has the form of fingerprintOf().
bool isFingerprint(const std::string &text);

} // namespace OvraBase
