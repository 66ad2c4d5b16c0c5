// SPDX-License-Identifier: Apache-2.0
#include "host/key_file.h"
#include "ovraplatform/sealed_box.h"

#include <ovrabase/encoding.h>

#include <unistd.h>

namespace OvraPlatform {

namespace {

constexpr KeyFileKind kKind = {"ovradr-seal", crypto_box_SECRETKEYBYTES,
                               "restore it, or remove it and set the appliance up again"};

} // namespace

tl::expected<SealKeyPair, std::string> SealKeyPair::load(const std::string &path) {
    SealKeyPair pair;
    const OvraBase::Expected<void> read = readKeyFile(path, kKind, pair.secret_.data());
    if (!read) {
        return tl::unexpected(read.error().text);
    }
    if (!OvraBase::sodiumReady() ||
        crypto_scalarmult_base(pair.public_.data(), pair.secret_.data()) != 0) {
        return tl::unexpected(path + " holds no key that can be used: " + kKind.remedy);
    }
    return pair;
}

tl::expected<SealKeyPair, std::string> SealKeyPair::loadOrCreate(const std::string &path) {
    if (access(path.c_str(), F_OK) == 0) {
        return load(path);
    }
    if (!OvraBase::sodiumReady()) {
        return tl::unexpected(std::string("libsodium cannot be used on this machine"));
    }
    SealKeyPair pair;
    crypto_box_keypair(pair.public_.data(), pair.secret_.data());
    const OvraBase::Expected<void> made = createKeyFile(path, kKind, pair.secret_.data());
    if (!made) {
        return tl::unexpected(made.error().text);
    }
    return load(path);
}

} // namespace OvraPlatform
