// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovrabase/address.h>
#include <ovraplatform/appliance.h>

#include <string>

using OvraFuzz::require;

// Settings without a problem are usable, and no damage widens where the appliance serves.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::string path = "/tmp/fuzz.conf";
    OvraFuzz::putFile(path.c_str(), OvraFuzz::textOf(data, size));
    const OvraPlatform::ApplianceConfig config = OvraPlatform::readApplianceConfig(path);
    require(config.httpPort > 0 && config.httpPort < 65536, "an HTTP port");
    require(config.httpsPort > 0 && config.httpsPort < 65536, "an HTTPS port");
    for (const std::string &address : config.addresses) {
        require(OvraBase::isNumericAddress(address), "an address is numeric");
    }
    require(!config.servesAllAddresses || config.addresses.empty(), "all addresses or some");
    require(!config.problems.empty() || config.servesAllAddresses || !config.addresses.empty(),
            "without a problem there is somewhere to serve");
    return 0;
}
