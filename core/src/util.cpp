// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/util.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdio>

namespace OvraDRCore {

std::string GenerateUUID() {
    std::array<unsigned char, 16> bytes{};
    if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
        return {};
    }
    bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0FU) | 0x40U); // version 4
    bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3FU) | 0x80U); // variant of RFC 9562
    std::string uuid;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10) {
            uuid += '-';
        }
        std::array<char, 3> hex{};
        std::snprintf(hex.data(), hex.size(), "%02x", static_cast<unsigned int>(bytes[i]));
        uuid += hex.data();
    }
    return uuid;
}

template <>
std::string ToString<int>(const int &value) {
    return std::to_string(value); // a stream would group the digits as the caller's locale does
}

namespace File {

namespace {

bool isDirectory(const std::string &path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

} // namespace

bool CreateDir(const std::string &path, mode_t mode) {
    if (path.empty()) {
        return false;
    }
    if (isDirectory(path)) {
        return true;
    }
    const std::size_t slash = path.find_last_of('/', path.find_last_not_of('/'));
    if (slash != std::string::npos && slash > 0 && !CreateDir(path.substr(0, slash), mode)) {
        return false;
    }
    if (mkdir(path.c_str(), mode) == 0) {
        return chmod(path.c_str(), mode) == 0; // regardless of the umask
    }
    return errno == EEXIST && isDirectory(path);
}

} // namespace File

} // namespace OvraDRCore
