// SPDX-License-Identifier: Apache-2.0
#include "core/secret_file.h"
#include "credential/sealed_box.h"

#include <unistd.h>

#include <algorithm>

namespace OvraPlatform {

namespace {

constexpr char kHeading[] = "ovradr-seal-1 ";

} // namespace

std::optional<SealKeyPair> SealKeyPair::fromText(const std::string &text) {
    constexpr std::size_t kHeadingSize = sizeof(kHeading) - 1;
    if (!text.starts_with(kHeading) || !text.ends_with('\n')) {
        return std::nullopt;
    }
    const auto bytes = fromBase64Url(text.substr(kHeadingSize, text.size() - kHeadingSize - 1));
    SealKeyPair pair;
    if (!bytes || bytes->size() != pair.secret_.size()) {
        return std::nullopt;
    }
    std::copy(bytes->begin(), bytes->end(), pair.secret_.begin());
    if (crypto_scalarmult_base(pair.public_.data(), pair.secret_.data()) != 0) {
        return std::nullopt;
    }
    return pair;
}

std::optional<SealKeyPair> SealKeyPair::load(const std::string &path, std::string &why) {
    std::string text;
    if (!readSecretFile(path, text, why)) {
        return std::nullopt;
    }
    std::optional<SealKeyPair> pair;
    if (sodiumReady()) {
        pair = fromText(text);
    }
    sodium_memzero(text.data(), text.size());
    if (!pair) {
        why = path + " is damaged: restore it, or remove it and set the appliance up again";
    }
    return pair;
}

std::optional<SealKeyPair> SealKeyPair::loadOrCreate(const std::string &path, std::string &why) {
    if (access(path.c_str(), F_OK) == 0) {
        return load(path, why);
    }
    if (!sodiumReady()) {
        why = "libsodium cannot be used on this machine";
        return std::nullopt;
    }
    SealKeyPair pair;
    crypto_box_keypair(pair.public_.data(), pair.secret_.data());
    std::string text = kHeading + toBase64Url(pair.secret_.data(), pair.secret_.size()) + "\n";
    const bool made = makeSecretFile(path, text, why);
    sodium_memzero(text.data(), text.size());
    if (!made) {
        return std::nullopt;
    }
    return load(path, why);
}

} // namespace OvraPlatform
