// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/totp.h"

#include <ovrabase/encoding.h>
#include <ovrabase/secret.h>

#include <liboath/oath.h>
#include <sodium.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdio>
#include <cstdlib>

namespace OvraPlatform {

namespace {

constexpr unsigned int kStepSeconds = 30;
constexpr unsigned int kDigits = 6;
constexpr std::size_t kNewSecretBytes = 20;
constexpr std::size_t kMinSecret = 16; // RFC 4226, 4, R6
constexpr std::size_t kMaxSecret = 64;

bool initialize() {
    static const bool done = OvraBase::sodiumReady() && oath_init() == OATH_OK;
    return done;
}

/// Memory allocated by liboath for a secret; wiped on release.
class SecretBuffer {
public:
    SecretBuffer() = default;
    SecretBuffer(const SecretBuffer &) = delete;
    SecretBuffer &operator=(const SecretBuffer &) = delete;
    ~SecretBuffer() {
        if (data != nullptr) {
            sodium_memzero(data, size);
            std::free(data);
        }
    }

    char *data = nullptr;
    std::size_t size = 0;
};

bool decode(const std::string &secret, SecretBuffer &bytes) {
    return initialize() &&
           oath_base32_decode(secret.data(), secret.size(), &bytes.data, &bytes.size) == OATH_OK &&
           bytes.size >= kMinSecret && bytes.size <= kMaxSecret;
}

std::string encode(const char *bytes, std::size_t size) {
    SecretBuffer text;
    if (oath_base32_encode(bytes, size, &text.data, &text.size) != OATH_OK) {
        return {};
    }
    const std::string_view padded(text.data, text.size);
    return std::string(padded.substr(0, padded.find('=')));
}

std::string percentEncode(const std::string &text) {
    constexpr std::string_view kUnreserved = "-._~"; // RFC 3986, 2.3
    std::string encoded;
    for (const char c : text) {
        const auto byte = static_cast<unsigned char>(c);
        if ((byte < 0x80 && std::isalnum(byte) != 0) ||
            kUnreserved.find(c) != std::string_view::npos) {
            encoded += c;
            continue;
        }
        std::array<char, 4> hex{};
        std::snprintf(hex.data(), hex.size(), "%%%02X", static_cast<unsigned int>(byte));
        encoded += hex.data();
    }
    return encoded;
}

} // namespace

std::string newTotpSecret() {
    if (!initialize()) {
        return {};
    }
    OvraBase::SecretBytes<kNewSecretBytes> bytes;
    randombytes_buf(bytes.data(), bytes.size());
    std::string secret = encode(reinterpret_cast<const char *>(bytes.data()), bytes.size());
    return secret;
}

std::string normalizeTotpSecret(const std::string &secret) {
    SecretBuffer bytes;
    return decode(secret, bytes) ? encode(bytes.data, bytes.size) : std::string();
}

std::optional<std::int64_t> matchTotp(const std::string &secret, std::string_view code,
                                      std::time_t now, std::int64_t after) {
    SecretBuffer bytes;
    const bool digits =
        std::all_of(code.begin(), code.end(), [](char c) { return c >= '0' && c <= '9'; });
    if (code.size() != kDigits || !digits || !decode(secret, bytes)) {
        return std::nullopt;
    }
    const std::int64_t current = now / kStepSeconds;
    std::optional<std::int64_t> match;
    for (std::int64_t step = current + 1; step >= current - 1; --step) {
        std::array<char, kDigits + 1> expected{};
        const int result = oath_totp_generate(bytes.data, bytes.size, step * kStepSeconds,
                                              kStepSeconds, 0, kDigits, expected.data());
        const bool same =
            result == OATH_OK && sodium_memcmp(expected.data(), code.data(), kDigits) == 0;
        if (same && step > after) {
            match = step;
        }
    }
    return match;
}

std::string totpUri(const std::string &issuer, const std::string &account,
                    const std::string &secret) {
    return "otpauth://totp/" + percentEncode(issuer) + ":" + percentEncode(account) +
           "?secret=" + secret + "&issuer=" + percentEncode(issuer) +
           "&algorithm=SHA1&digits=" + std::to_string(kDigits) +
           "&period=" + std::to_string(kStepSeconds);
}

} // namespace OvraPlatform
