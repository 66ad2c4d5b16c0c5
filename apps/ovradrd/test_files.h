// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "core/unique_fd.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace Ovradrd {

/// Below this URL path lie the files by which peers measure the link, each under its absolute path
/// in the file system: "/webman/modules/ovradr/" + "/usr/ovra/var/ovradr/speedtest/speed-...".
inline constexpr std::string_view kTestFilesUrl = "/webman/modules/ovradr/";

struct TestFile {
    OvraPlatform::UniqueFd fd;
    std::uint64_t size = 0;
};

/// Opens the file that a URL path names; nothing when it is any other path. Only the names that
/// scripts/TestSyncSpeed.sh gives, in its one folder, are opened, no link is followed, and the file
/// has to be a regular one of our own user: whatever the URL says, nothing else is reached.
/// \param path  as it is once its escapes were resolved
std::optional<TestFile> openTestFile(std::string_view path);

/// Which part of a file a client gets.
struct FilePart {
    enum class Kind { kWhole, kPart, kUnsatisfiable };

    Kind kind = Kind::kWhole;
    std::uint64_t first = 0;
    std::uint64_t length = 0;
};

/// Reads a header "Range" (RFC 9110, 14.1.2 and 14.2): one range of bytes. Whatever else it may say
/// is passed over, as a server may, and the client gets the whole file.
/// \param range  "" where the client sent none
FilePart partOf(std::string_view range, std::uint64_t size);

} // namespace Ovradrd
