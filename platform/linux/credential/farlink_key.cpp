// SPDX-License-Identifier: Apache-2.0
#include "credential/farlink_key.h"

#include "core/secret_file.h"

#include <unistd.h>

#include <algorithm>
#include <array>

namespace OvraPlatform {

namespace {

constexpr char kHeading[] = "ovradr-farlink-1 ";

std::string signedText(const std::string &alias, const std::string &challenge) {
    return kHeading + alias + " " + challenge;
}

const unsigned char *bytesOf(const std::string &text) {
    return reinterpret_cast<const unsigned char *>(text.data());
}

} // namespace

std::optional<FarlinkKey> FarlinkKey::fromText(const std::string &text) {
    constexpr std::size_t kHeadingSize = sizeof(kHeading) - 1;
    if (!text.starts_with(kHeading) || !text.ends_with('\n')) {
        return std::nullopt;
    }
    const auto bytes = fromBase64Url(text.substr(kHeadingSize, text.size() - kHeadingSize - 1));
    FarlinkKey key;
    if (!bytes || bytes->size() != key.secret_.size()) {
        return std::nullopt;
    }
    std::copy(bytes->begin(), bytes->end(), key.secret_.begin());
    return key;
}

std::optional<FarlinkKey> FarlinkKey::loadOrCreate(std::string &why, const std::string &path) {
    if (!sodiumReady()) {
        why = "libsodium cannot be used on this machine";
        return std::nullopt;
    }
    std::string text;
    if (access(path.c_str(), F_OK) != 0) {
        FarlinkKey made;
        std::array<unsigned char, crypto_sign_PUBLICKEYBYTES> ignored{};
        crypto_sign_keypair(ignored.data(), made.secret_.data());
        text = kHeading + toBase64Url(made.secret_.data(), made.secret_.size()) + "\n";
        const bool stored = makeSecretFile(path, text, why);
        sodium_memzero(text.data(), text.size());
        if (!stored) {
            return std::nullopt;
        }
    }
    if (!readSecretFile(path, text, why)) {
        return std::nullopt;
    }
    std::optional<FarlinkKey> key = fromText(text);
    sodium_memzero(text.data(), text.size());
    if (!key) {
        why = path + " is damaged: restore it, or remove it and choose another alias";
    }
    return key;
}

std::string FarlinkKey::publicText() const {
    std::array<unsigned char, crypto_sign_PUBLICKEYBYTES> bytes{};
    crypto_sign_ed25519_sk_to_pk(bytes.data(), secret_.data());
    return toBase64Url(bytes.data(), bytes.size());
}

std::string FarlinkKey::sign(const std::string &alias, const std::string &challenge) const {
    const std::string text = signedText(alias, challenge);
    std::array<unsigned char, crypto_sign_BYTES> signature{};
    crypto_sign_detached(signature.data(), nullptr, bytesOf(text), text.size(), secret_.data());
    return toBase64Url(signature.data(), signature.size());
}

bool verifyFarlink(const std::string &publicText, const std::string &alias,
                   const std::string &challenge, const std::string &signature) {
    const auto key = fromBase64Url(publicText);
    const auto proof = fromBase64Url(signature);
    if (!sodiumReady() || !key || key->size() != crypto_sign_PUBLICKEYBYTES || !proof ||
        proof->size() != crypto_sign_BYTES) {
        return false;
    }
    const std::string text = signedText(alias, challenge);
    return crypto_sign_verify_detached(proof->data(), bytesOf(text), text.size(), key->data()) == 0;
}

} // namespace OvraPlatform
