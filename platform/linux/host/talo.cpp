// SPDX-License-Identifier: Apache-2.0
#include "ovraw3/talo.h"

#include "ovraplatform/appliance.h"

namespace ovraw3 {

Talo::Talo() = default;
Talo::~Talo() = default;

int Talo::GetHttpPort() {
    return OvraPlatform::readApplianceConfig().httpPort;
}

int Talo::GetHttpsPort() {
    return OvraPlatform::readApplianceConfig().httpsPort;
}

} // namespace ovraw3
