// SPDX-License-Identifier: Apache-2.0
#include "credential/device_token.h"

#include "host/key_file.h"
#include "ovraplatform/appliance.h"

#include <ovrabase/encoding.h>
#include <ovradrcore/log.h>

#include <sodium.h>
#include <unistd.h>

#include <array>

namespace OvraPlatform {

namespace {

constexpr KeyFileKind kKind = {"ovradr-device", crypto_generichash_KEYBYTES, "remove it"};

using Key = OvraBase::SecretBytes<crypto_generichash_KEYBYTES>;

OvraBase::Expected<void> loadOrCreate(Key &key) {
    if (access(kDeviceKeyFile, F_OK) != 0) {
        randombytes_buf(key.data(), key.size());
        if (auto made = createKeyFile(kDeviceKeyFile, kKind, key.data()); !made) {
            return made;
        }
    }
    return readKeyFile(kDeviceKeyFile, kKind, key.data());
}

} // namespace

OvraBase::Secret deviceToken(const Endpoint &endpoint, const std::string &account) {
    Key key;
    if (access(kStateDir, W_OK) != 0 || !OvraBase::sodiumReady()) {
        return {};
    }
    if (const auto loaded = loadOrCreate(key); !loaded) {
        OVRA_NOTICE("Other appliances cannot know this one again at a log-in: %s",
                    loaded.error().text.c_str());
        return {};
    }
    const std::string text = endpoint.key() + "\n" + account;
    std::array<unsigned char, crypto_generichash_BYTES> token{};
    crypto_generichash(token.data(), token.size(),
                       reinterpret_cast<const unsigned char *>(text.data()), text.size(),
                       key.data(), key.size());
    std::string encoded = OvraBase::toBase64Url(token.data(), token.size());
    return OvraBase::Secret::take(encoded);
}

} // namespace OvraPlatform
