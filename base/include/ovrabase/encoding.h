// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// Text encodings of bytes, by libsodium. The functions that hash need sodiumReady() first.
namespace OvraBase {

/// Initialises libsodium; true on success. Cheap to repeat, in any thread.
bool sodiumReady();

/// Base64url, unpadded (RFC 4648, section 5).
std::string toBase64Url(const unsigned char *data, std::size_t size);
/// std::nullopt for any other text.
std::optional<std::vector<unsigned char>> fromBase64Url(const std::string &text);

/// Base64, padded (RFC 4648, section 4).
std::string toBase64(std::string_view bytes);

/// "SHA256:" and the unpadded base64 (RFC 4648, section 4) of the SHA-256 of the bytes, the form
/// used by ssh-keygen(1).
std::string fingerprintOf(const unsigned char *data, std::size_t size);
/// Whether the text has the form of fingerprintOf().
bool isFingerprint(const std::string &text);

} // namespace OvraBase
