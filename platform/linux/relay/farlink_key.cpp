// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/farlink_key.h"

#include "host/key_file.h"

#include <ovrabase/encoding.h>

#include <unistd.h>

#include <array>

namespace OvraPlatform {

namespace {

/// Precedes the signed text.
constexpr char kHeading[] = "ovradr-farlink-1 ";
constexpr KeyFileKind kKind = {"ovradr-farlink", crypto_sign_SECRETKEYBYTES,
                               "restore it, or remove it and choose another alias"};

std::string signedText(const std::string &alias, const std::string &challenge) {
    return kHeading + alias + " " + challenge;
}

const unsigned char *bytesOf(const std::string &text) {
    return reinterpret_cast<const unsigned char *>(text.data());
}

} // namespace

tl::expected<FarlinkKey, std::string> FarlinkKey::loadOrCreate(const std::string &path) {
    if (!OvraBase::sodiumReady()) {
        return tl::unexpected(std::string("libsodium cannot be used on this machine"));
    }
    FarlinkKey key;
    if (access(path.c_str(), F_OK) != 0) {
        std::array<unsigned char, crypto_sign_PUBLICKEYBYTES> ignored{};
        crypto_sign_keypair(ignored.data(), key.secret_.data());
        if (const auto made = createKeyFile(path, kKind, key.secret_.data()); !made) {
            return tl::unexpected(made.error().text);
        }
    }
    if (const auto read = readKeyFile(path, kKind, key.secret_.data()); !read) {
        return tl::unexpected(read.error().text);
    }
    return key;
}

std::string FarlinkKey::publicText() const {
    std::array<unsigned char, crypto_sign_PUBLICKEYBYTES> bytes{};
    crypto_sign_ed25519_sk_to_pk(bytes.data(), secret_.data());
    return OvraBase::toBase64Url(bytes.data(), bytes.size());
}

std::string FarlinkKey::sign(const std::string &alias, const std::string &challenge) const {
    const std::string text = signedText(alias, challenge);
    std::array<unsigned char, crypto_sign_BYTES> signature{};
    crypto_sign_detached(signature.data(), nullptr, bytesOf(text), text.size(), secret_.data());
    return OvraBase::toBase64Url(signature.data(), signature.size());
}

bool verifyFarlink(const std::string &publicText, const std::string &alias,
                   const std::string &challenge, const std::string &signature) {
    const auto key = OvraBase::fromBase64Url(publicText);
    const auto proof = OvraBase::fromBase64Url(signature);
    if (!OvraBase::sodiumReady() || !key || key->size() != crypto_sign_PUBLICKEYBYTES || !proof ||
        proof->size() != crypto_sign_BYTES) {
        return false;
    }
    const std::string text = signedText(alias, challenge);
    return crypto_sign_verify_detached(proof->data(), bytesOf(text), text.size(), key->data()) == 0;
}

} // namespace OvraPlatform
