// SPDX-License-Identifier: Apache-2.0

// The appliance's interfaces and its PPPoE link, set by the test.

#include "stand_in.h"

#include <ovranet/ovranet.h>

#include <cstdio>

extern "C" {

int OLIBNetGetInterfaceInfo(OLIBNetInterface *table, int size, int selector) {
    int filled = 0;
    for (const OvraVendor::Interface &each : OvraVendor::netLibrary.interfaces) {
        const bool six = each.address.find(':') != std::string::npos;
        if ((selector & (six ? OLIB_NET_SELECT_IPV6 : OLIB_NET_SELECT_IPV4)) == 0) {
            continue;
        }
        if (filled == size) {
            break;
        }
        OLIBNetInterface &entry = table[filled++];
        std::snprintf(entry.name, sizeof(entry.name), "%s", each.name.c_str());
        std::snprintf(entry.address, sizeof(entry.address), "%s", each.address.c_str());
        entry.status = each.up ? OLIB_NET_STATUS_UP : OLIB_NET_STATUS_DOWN;
    }
    return filled;
}

int OVRAPPPoECheckStatus(int index) {
    return index == 1 && OvraVendor::netLibrary.pppoe ? 1 : 0;
}

int OVRAPPPoeNetInfoGet(char *buffer, int size, int /*unit*/, int /*flags*/) {
    const auto &address = OvraVendor::netLibrary.pppoe;
    if (!address || static_cast<int>(address->size()) >= size) {
        return -1;
    }
    std::snprintf(buffer, static_cast<std::size_t>(size), "%s", address->c_str());
    return 0;
}
}
