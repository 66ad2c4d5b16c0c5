// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/appliance.h"

#include <string>
#include <vector>

namespace OvraPlatform {

/// Where a machine's identity is found.
struct HostFiles {
    std::string serial = "/sys/class/dmi/id/product_serial"; ///< readable for root only
    std::vector<std::string> machineIds = {"/etc/machine-id", "/var/lib/dbus/machine-id"};
};

/// The serial number: the configured one; else the one in the firmware, unless it is one of the
/// placeholder texts of makers; else an id of 24 hexadecimal digits made from the machine id, which
/// itself must not be published (machine-id(5)) and cannot be recovered from it. "" if the machine
/// has none of them.
std::string serialNumber(const ApplianceConfig &config, const HostFiles &files = {});

/// The configured host name, else the system's; "" if that cannot be read.
std::string hostName(const ApplianceConfig &config);

} // namespace OvraPlatform
