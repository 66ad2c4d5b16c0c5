// SPDX-License-Identifier: Apache-2.0
#include "test_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <string>
#include <system_error>

namespace Ovradrd {

namespace {

using OvraBase::UniqueFd;

// Both are those of scripts/TestSyncSpeed.sh.
constexpr char kFolder[] = "/usr/ovra/var/ovradr/speedtest";
constexpr std::string_view kNameStart = "speed-";
constexpr std::size_t kNameDigits = 32;
/// 32 endpoints of this node, 45 seconds each.
constexpr std::chrono::minutes kLongestUse{30};

bool consume(std::string_view &text, std::string_view prefix) {
    const bool matches = text.starts_with(prefix);
    if (matches) {
        text.remove_prefix(prefix.size());
    }
    return matches;
}

/// The name of the test file in the folder; "" for any other path.
std::string nameIn(std::string_view path) {
    if (!consume(path, kTestFilesUrl) || !consume(path, kFolder) || !consume(path, "/")) {
        return {};
    }
    std::string name(path);
    const bool ours = consume(path, kNameStart) && path.size() == kNameDigits &&
                      std::all_of(path.begin(), path.end(), [](char c) {
                          return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
                      });
    return ours ? name : std::string();
}

} // namespace

std::optional<OvraService::ServedFile> openTestFile(std::string_view path) {
    const std::string name = nameIn(path);
    if (name.empty()) {
        return std::nullopt;
    }
    // The name is flat, so that without following links there is no way out of the folder.
    constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_CLOEXEC;
    const UniqueFd folder(open(kFolder, kFlags | O_DIRECTORY));
    if (!folder) {
        return std::nullopt;
    }
    // A FIFO would block the thread without O_NONBLOCK.
    UniqueFd file(openat(folder.get(), name.c_str(), kFlags | O_NONBLOCK));
    struct stat status {};
    if (!file || fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) ||
        status.st_uid != geteuid() || status.st_nlink != 1) {
        return std::nullopt;
    }
    return OvraService::ServedFile{std::move(file), static_cast<std::uint64_t>(status.st_size)};
}

void sweepTestFiles() {
    std::error_code error;
    const auto now = std::filesystem::file_time_type::clock::now();
    for (const auto &entry : std::filesystem::directory_iterator(kFolder, error)) {
        const auto path = std::string(kTestFilesUrl) + entry.path().string();
        const auto made = std::filesystem::last_write_time(entry.path(), error);
        if (!nameIn(path).empty() && !error && now - made > kLongestUse) {
            std::filesystem::remove(entry.path(), error);
        }
    }
}

OvraService::FileSource testFiles(std::size_t atOnce) {
    return {std::string(kTestFilesUrl), openTestFile, atOnce,
            "there is no such test file: start the test anew",
            "too many tests run at once: try again later"};
}

} // namespace Ovradrd
