// SPDX-License-Identifier: Apache-2.0
#include "test_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <string>

namespace Ovradrd {

namespace {

using OvraPlatform::UniqueFd;

// Both are those of scripts/TestSyncSpeed.sh.
constexpr char kFolder[] = "/usr/ovra/var/ovradr/speedtest";
constexpr std::string_view kNameStart = "speed-";
constexpr std::size_t kNameDigits = 32;

constexpr std::string_view kRangeUnit = "bytes=";

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

/// A number that is all of `text`.
std::optional<std::uint64_t> numberIn(std::string_view text) {
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool whole = error == std::errc() && end == text.data() + text.size();
    return whole ? std::optional(number) : std::nullopt;
}

} // namespace

std::optional<TestFile> openTestFile(std::string_view path) {
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
    return TestFile{std::move(file), static_cast<std::uint64_t>(status.st_size)};
}

FilePart partOf(std::string_view range, std::uint64_t size) {
    const FilePart whole{FilePart::Kind::kWhole, 0, size};
    const std::size_t dash = range.find('-');
    if (!consume(range, kRangeUnit) || dash == std::string_view::npos) {
        return whole;
    }
    const std::string_view begin = range.substr(0, range.find('-'));
    const std::string_view end = range.substr(begin.size() + 1);
    const auto first = numberIn(begin);
    const auto last = numberIn(end);
    const bool wellFormed = (first || begin.empty()) && (last || end.empty()) && (first || last) &&
                            !(first && last && *last < *first);
    if (!wellFormed) {
        return whole;
    }
    // Without a first byte it means the last ones.
    const std::uint64_t from = first ? *first : size - std::min(*last, size);
    if (from >= size) {
        return {FilePart::Kind::kUnsatisfiable, 0, 0};
    }
    const std::uint64_t to = first && last ? std::min(*last, size - 1) : size - 1;
    return {FilePart::Kind::kPart, from, to - from + 1};
}

} // namespace Ovradrd
