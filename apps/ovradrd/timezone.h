// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>

namespace Ovradrd {

/// Where a machine's time zone is set.
struct TimezoneFiles {
    std::string link = "/etc/localtime"; ///< points below a folder "zoneinfo" (tzfile(5))
    std::string name = "/etc/timezone";  ///< holds the name itself, on Debian
};

/// The IANA name of the machine's time zone, e.g. "Europe/Zurich": from the environment variable
/// TZ, the link, or the file, in that order, as the C library finds the zone itself (tzset(3));
/// "Etc/UTC" if none is set. "" if a zone is set but its name cannot be determined.
std::string localTimezone(const TimezoneFiles &files = {});

} // namespace Ovradrd
