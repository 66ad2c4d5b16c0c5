// SPDX-License-Identifier: Apache-2.0

// The appliance's serial number and host name, set by the test.

#include "stand_in.h"

#include <ovracore/ovracore.h>

namespace {

int copy(const std::optional<std::string> &text, char *buffer, int size) {
    if (!text || static_cast<int>(text->size()) >= size) {
        return -1;
    }
    return std::snprintf(buffer, static_cast<std::size_t>(size), "%s", text->c_str());
}

} // namespace

extern "C" {
int OLIBGetSerialNumber(char *buffer, int size) {
    return copy(OvraVendor::sdkLibrary.serial, buffer, size);
}
int OVRALnxGetHostname(char *buffer, int size) {
    return copy(OvraVendor::sdkLibrary.hostName, buffer, size);
}
}
