// SPDX-License-Identifier: Apache-2.0
#include "host/key_file.h"

#include <ovrabase/encoding.h>
#include <ovrabase/file.h>
#include <ovrabase/secret.h>

#include <algorithm>
#include <cerrno>
#include <string_view>

namespace OvraPlatform {

using OvraBase::Expected;
using OvraBase::Unexpected;

namespace {

constexpr mode_t kMode = 0600;

Unexpected cannot(const char *what, const std::string &path, const OvraBase::Error &why) {
    return Unexpected({"cannot " + std::string(what) + " " + path + ": " + why.text, why.number});
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
    const std::string &text = content->get();
    const std::string_view heading = kind.heading;
    if (text.starts_with(heading) && text.ends_with('\n')) {
        const auto bytes =
            OvraBase::fromBase64Url(text.substr(heading.size(), text.size() - heading.size() - 1));
        if (bytes && bytes->size() == kind.size) {
            std::copy(bytes->begin(), bytes->end(), key);
            return {};
        }
    }
    return Unexpected({path + " is damaged: " + kind.remedy});
}

Expected<void> createKeyFile(const std::string &path, const KeyFileKind &kind,
                             const unsigned char *key) {
    std::string text = kind.heading + OvraBase::toBase64Url(key, kind.size) + "\n";
    const OvraBase::WipeAtEnd wiped(text);
    const Expected<bool> made = OvraBase::createFile(path, text, kMode);
    if (!made) {
        return cannot("write", path, made.error());
    }
    return {};
}

} // namespace OvraPlatform
