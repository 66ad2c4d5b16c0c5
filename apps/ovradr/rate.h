// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace Ovradr {

/// The bits a second of a speed as scripts/TestDownloadSpeed.sh words it, "NUMBER Mbit/s", or with
/// another prefix or in bytes ("MB/s"); nothing for another wording, which an appliance may have.
std::optional<double> bitsPerSecond(const std::string &speed);

/// The speed for people, "94.1 Mbit/s (11.8 MB/s)"; another wording as it is.
std::string rateText(const std::string &speed);

} // namespace Ovradr
