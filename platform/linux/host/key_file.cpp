// SPDX-License-Identifier: Apache-2.0
#include "host/key_file.h"

#include <ovrabase/encoding.h>
#include <ovrabase/file.h>
#include <ovrabase/secret.h>

#include <sodium.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <string_view>
#include <vector>

namespace OvraPlatform {

using OvraBase::Expected;
using OvraBase::Unexpected;

namespace {

constexpr mode_t kMode = 0600;
constexpr std::string_view kUnchecked = "-1 ";
constexpr std::string_view kChecked = "-2 ";
constexpr std::size_t kCheckSize = 8;

Unexpected cannot(const char *what, const std::string &path, const OvraBase::Error &why) {
    return Unexpected({"cannot " + std::string(what) + " " + path + ": " + why.text, why.number});
}

/// The key and its check: the first bytes of the BLAKE2b of its kind and itself.
std::vector<unsigned char> withCheck(const KeyFileKind &kind, const unsigned char *key) {
    std::array<unsigned char, crypto_generichash_BYTES> hash{};
    crypto_generichash_state state;
    crypto_generichash_init(&state, nullptr, 0, hash.size());
    crypto_generichash_update(&state, reinterpret_cast<const unsigned char *>(kind.name),
                              std::string_view(kind.name).size());
    crypto_generichash_update(&state, key, kind.size);
    crypto_generichash_final(&state, hash.data(), hash.size());
    explicit_bzero(&state, sizeof(state));
    std::vector<unsigned char> bytes(key, key + kind.size);
    bytes.insert(bytes.end(), hash.begin(), hash.begin() + kCheckSize);
    return bytes;
}

void wipe(std::vector<unsigned char> &bytes) {
    explicit_bzero(bytes.data(), bytes.size());
}

/// Copies the key out of its line, if it is as it was written.
bool takeKey(std::string_view text, const KeyFileKind &kind, unsigned char *key) {
    if (!text.starts_with(kind.name) || !text.ends_with('\n')) {
        return false;
    }
    text.remove_prefix(std::string_view(kind.name).size());
    const bool checked = text.starts_with(kChecked);
    if (!checked && !text.starts_with(kUnchecked)) {
        return false;
    }
    std::string encoded(text.substr(kChecked.size(), text.size() - kChecked.size() - 1));
    const OvraBase::WipeAtEnd wiped(encoded);
    auto bytes = OvraBase::fromBase64Url(encoded);
    if (!bytes) {
        return false;
    }
    auto whole = bytes->size() < kind.size ? *bytes : withCheck(kind, bytes->data());
    const bool sound =
        checked ? *bytes == whole && whole.size() > kind.size : bytes->size() == kind.size;
    if (sound) {
        std::copy_n(bytes->begin(), kind.size, key);
    }
    wipe(whole);
    wipe(*bytes);
    return sound;
}

} // namespace

Expected<void> readKeyFile(const std::string &path, const KeyFileKind &kind, unsigned char *key) {
    const Expected<OvraBase::Secret> content =
        OvraBase::readPrivateFile(path, OvraBase::Links::kRefuse);
    if (!content && (content.error().number == EPERM || content.error().number == EINVAL)) {
        return Unexpected({path + " must be a file of our own that only its owner can read: " +
                           content.error().text +
                           "; chmod 600, and make a new key if others may have read it"});
    }
    if (!content) {
        return cannot("read", path, content.error());
    }
    if (!takeKey(content->get(), kind, key)) {
        return Unexpected(
            {path + " is damaged, or of a newer version than this program: " + kind.remedy});
    }
    return {};
}

Expected<void> createKeyFile(const std::string &path, const KeyFileKind &kind,
                             const unsigned char *key) {
    auto bytes = withCheck(kind, key);
    std::string text = kind.name + std::string(kChecked) +
                       OvraBase::toBase64Url(bytes.data(), bytes.size()) + "\n";
    const OvraBase::WipeAtEnd wiped(text);
    wipe(bytes);
    const Expected<bool> made = OvraBase::createFile(path, text, kMode);
    if (!made) {
        return cannot("write", path, made.error());
    }
    return {};
}

} // namespace OvraPlatform
