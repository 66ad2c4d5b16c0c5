// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <optional>
#include <string>

namespace Ovradr {

/// The bits per second of a speed as scripts/TestDownloadSpeed.sh words it, "NUMBER Mbit/s", or
/// with another prefix or in bytes ("MB/s"); std::nullopt for another wording, which an appliance
/// may use.
std::optional<double> bitsPerSecond(const std::string &speed);

/// The speed for people, "94.1 Mbit/s (11.8 MB/s)"; another wording unchanged.
std::string rateText(const std::string &speed);

} // namespace Ovradr
