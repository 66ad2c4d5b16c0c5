// SPDX-License-Identifier: Apache-2.0
#include "core/file_update.h"
#include "core/unique_fd.h"
#include "credential/sealed_box.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace OvraPlatform {

namespace {

constexpr char kHeading[] = "ovradr-seal-1 ";
constexpr std::size_t kLargestFile = 256;

bool writeAll(int fd, const std::string &text) {
    return write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) &&
           fsync(fd) == 0;
}

void syncFolderOf(const std::string &path) {
    const UniqueFd folder(open(path.substr(0, path.find_last_of('/') + 1).c_str(),
                               O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (folder) {
        fsync(folder.get());
    }
}

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
    const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    struct stat status {};
    if (!fd || fstat(fd.get(), &status) != 0) {
        why = "cannot read " + path + ": " + errnoText(errno);
        return std::nullopt;
    }
    if (!S_ISREG(status.st_mode) || (status.st_mode & 077U) != 0) {
        why = path + " must be a file that only its owner can read: chmod 600, and make a new key "
                     "if others may have read it";
        return std::nullopt;
    }
    std::string text(kLargestFile, '\0');
    const ssize_t size = read(fd.get(), text.data(), text.size());
    text.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
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
    // Written aside and then linked: the file is complete when its name appears, and a name that
    // another process has made meanwhile is not replaced.
    std::string aside = path + ".XXXXXX";
    const UniqueFd fd(mkostemp(aside.data(), O_CLOEXEC));
    if (!fd) {
        why = "cannot make " + path + ": " + errnoText(errno);
        return std::nullopt;
    }
    const bool linked =
        writeAll(fd.get(),
                 kHeading + toBase64Url(pair.secret_.data(), pair.secret_.size()) + "\n") &&
        (link(aside.c_str(), path.c_str()) == 0 || errno == EEXIST);
    if (!linked) {
        why = "cannot write " + path + ": " + errnoText(errno);
    }
    unlink(aside.c_str());
    if (!linked) {
        return std::nullopt;
    }
    syncFolderOf(path);
    return load(path, why);
}

} // namespace OvraPlatform
