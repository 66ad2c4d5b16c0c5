// SPDX-License-Identifier: Apache-2.0
#include "timezone.h"

#include <ovrabase/file.h>

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace Ovradrd {

namespace {

constexpr char kUtc[] = "Etc/UTC";
constexpr char kZoneFolder[] = "/zoneinfo/";
constexpr std::size_t kMaxName = 64;

/// The text if it has the form of a zone name, otherwise "".
std::string zoneName(std::string text) {
    text.erase(std::min(text.find_first_of("\r\n"), text.size()));
    const bool named =
        !text.empty() && text.size() <= kMaxName && text.front() != '/' &&
        std::all_of(text.begin(), text.end(), [](unsigned char c) {
            return std::isalnum(c) != 0 || c == '/' || c == '_' || c == '-' || c == '+';
        });
    return named ? text : std::string();
}

std::string zoneOfPath(const std::string &path) {
    const std::size_t folder = path.find(kZoneFolder);
    return folder == std::string::npos ? std::string()
                                       : zoneName(path.substr(folder + sizeof(kZoneFolder) - 1));
}

/// TZ may hold a name or a path, with or without a colon before it.
std::string zoneOfVariable(std::string value) {
    if (!value.empty() && value.front() == ':') {
        value.erase(0, 1);
    }
    return value.find(kZoneFolder) == std::string::npos ? zoneName(value) : zoneOfPath(value);
}

} // namespace

std::string localTimezone(const TimezoneFiles &files) {
    const char *const variable = std::getenv("TZ"); // NOLINT(concurrency-mt-unsafe): nobody sets it
    if (variable != nullptr && *variable != '\0') {
        return zoneOfVariable(variable);
    }
    std::error_code error;
    const auto target = std::filesystem::read_symlink(files.link, error);
    if (!error) {
        return zoneOfPath(target.string());
    }
    const std::string name = zoneName(OvraBase::readFile(files.name).value_or(""));
    return name.empty() && !std::filesystem::exists(files.link, error) ? kUtc : name;
}

} // namespace Ovradrd
