// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/encoding.h"

#include <sodium.h>

#include <array>

namespace OvraBase {

namespace {

constexpr char kFingerprintPrefix[] = "SHA256:";

std::string toBase64(const unsigned char *data, std::size_t size, int variant) {
    std::string text(sodium_base64_encoded_len(size, variant), '\0');
    sodium_bin2base64(text.data(), text.size(), data, size, variant);
    text.pop_back(); // the closing NUL
    return text;
}

std::optional<std::vector<unsigned char>> fromBase64(const std::string &text, int variant) {
    std::vector<unsigned char> bytes(text.size() / 4 * 3 + 3);
    std::size_t size = 0;
    if (sodium_base642bin(bytes.data(), bytes.size(), text.data(), text.size(), nullptr, &size,
                          nullptr, variant) != 0) {
        return std::nullopt;
    }
    bytes.resize(size);
    return bytes;
}

} // namespace

bool sodiumReady() {
    return sodium_init() >= 0;
}

std::string toBase64(std::string_view bytes) {
    return toBase64(reinterpret_cast<const unsigned char *>(bytes.data()), bytes.size(),
                    sodium_base64_VARIANT_ORIGINAL);
}

std::string toBase64Url(const unsigned char *data, std::size_t size) {
    return toBase64(data, size, sodium_base64_VARIANT_URLSAFE_NO_PADDING);
}

std::optional<std::vector<unsigned char>> fromBase64Url(const std::string &text) {
    return fromBase64(text, sodium_base64_VARIANT_URLSAFE_NO_PADDING);
}

std::string fingerprintOf(const unsigned char *data, std::size_t size) {
    std::array<unsigned char, crypto_hash_sha256_BYTES> digest{};
    crypto_hash_sha256(digest.data(), data, size);
    return kFingerprintPrefix +
           toBase64(digest.data(), digest.size(), sodium_base64_VARIANT_ORIGINAL_NO_PADDING);
}

bool isFingerprint(const std::string &text) {
    if (!text.starts_with(kFingerprintPrefix)) {
        return false;
    }
    const auto digest = fromBase64(text.substr(sizeof(kFingerprintPrefix) - 1),
                                   sodium_base64_VARIANT_ORIGINAL_NO_PADDING);
    return digest && digest->size() == crypto_hash_sha256_BYTES;
}

} // namespace OvraBase
