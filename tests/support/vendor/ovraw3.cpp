// SPDX-License-Identifier: Apache-2.0

// The ports of the appliance's web server, set by the test.

#include "stand_in.h"

#include <ovraw3/talo.h>

namespace ovraw3 {

Talo::Talo() {
    ++OvraVendor::w3Library.clients;
}

Talo::~Talo() {
    --OvraVendor::w3Library.clients;
}

int Talo::GetHttpPort() {
    return OvraVendor::w3Library.http;
}

int Talo::GetHttpsPort() {
    return OvraVendor::w3Library.https;
}

} // namespace ovraw3
