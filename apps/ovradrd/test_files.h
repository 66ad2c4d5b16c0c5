// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/http_server.h"

#include <cstddef>
#include <optional>
#include <string_view>

namespace Ovradrd {

/// Below this URL path are the files with which peers measure the link, each under its absolute
/// file system path: "/webman/modules/ovradr/" + "/usr/ovra/var/ovradr/speedtest/speed-...".
inline constexpr std::string_view kTestFilesUrl = "/webman/modules/ovradr/";

/// Opens the test file that a URL path names; std::nullopt for any other path. Opens only names as
/// given by scripts/TestSyncSpeed.sh, in its one folder, follows no link, and requires a regular
/// file of our own user: no URL reaches anything else.
/// \param path  with its escapes resolved
[[nodiscard]] std::optional<OvraService::ServedFile> openTestFile(std::string_view path);

/// Removes those that no measurement uses any more: one that was interrupted leaves its file.
void sweepTestFiles();

/// Those files for the HTTP server.
/// \param atOnce  how many are sent at once
OvraService::FileSource testFiles(std::size_t atOnce);

} // namespace Ovradrd
