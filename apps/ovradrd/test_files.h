// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/http_server.h"

#include <cstddef>
#include <optional>
#include <string_view>

namespace Ovradrd {

/// Below this URL path lie the files by which peers measure the link, each under its absolute path
/// in the file system: "/webman/modules/ovradr/" + "/usr/ovra/var/ovradr/speedtest/speed-...".
inline constexpr std::string_view kTestFilesUrl = "/webman/modules/ovradr/";

/// Opens the file that a URL path names; std::nullopt if it is any other path. Only the names that
/// scripts/TestSyncSpeed.sh gives, in its one folder, are opened, no link is followed, and the file
/// must be a regular one of our own user: whatever the URL says, nothing else is reached.
/// \param path  as it is once its escapes were resolved
[[nodiscard]] std::optional<OvraService::ServedFile> openTestFile(std::string_view path);

/// Those files for the HTTP server.
/// \param atOnce  how many are sent at the same time
OvraService::FileSource testFiles(std::size_t atOnce);

} // namespace Ovradrd
