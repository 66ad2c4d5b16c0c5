// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/export.h"

#include <sodium.h>

#include <array>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace OvraPlatform {

/// Bytes that are wiped when they go.
template <std::size_t Size>
struct SecretBytes : std::array<unsigned char, Size> {
    SecretBytes()
        : std::array<unsigned char, Size>{} {}
    SecretBytes(const SecretBytes &) = default;
    SecretBytes &operator=(const SecretBytes &) = default;
    ~SecretBytes() { sodium_memzero(this->data(), Size); }
};

/// Text that is wiped when it goes or is replaced.
class SecretText {
public:
    SecretText() = default;
    explicit SecretText(const std::string &text)
        : text_(text) {}
    SecretText(const SecretText &) = default;
    SecretText &operator=(const SecretText &other) {
        if (this != &other) {
            wipe();
            text_ = other.text_;
        }
        return *this;
    }
    ~SecretText() { wipe(); }

    const std::string &get() const { return text_; }
    bool empty() const { return text_.empty(); }

private:
    void wipe() { sodium_memzero(text_.data(), text_.size()); }

    std::string text_;
};

/// libsodium is ready; safe to ask from any thread, any number of times.
OVRAPLATFORM_EXPORT bool sodiumReady();

/// Base64 with the alphabet that is safe in URLs, unpadded (RFC 4648, section 5).
OVRAPLATFORM_EXPORT std::string toBase64Url(const unsigned char *data, std::size_t size);
/// Nothing when the text is anything else.
OVRAPLATFORM_EXPORT std::optional<std::vector<unsigned char>>
fromBase64Url(const std::string &text);

/// "SHA256:" and the unpadded base64 (RFC 4648, section 4) of the SHA-256 of the bytes, the form in
/// which people know fingerprints from ssh-keygen(1).
std::string fingerprintOf(const unsigned char *data, std::size_t size);
/// Whether the text has the form of fingerprintOf().
bool isFingerprint(const std::string &text);

} // namespace OvraPlatform
