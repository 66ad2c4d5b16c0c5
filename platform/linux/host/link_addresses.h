// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovranet/ovranet.h"
#include "ovraplatform/appliance.h"

#include <string>
#include <vector>

namespace OvraPlatform {

/// One address of one of the machine's interfaces.
struct LinkAddress {
    std::string interface;
    unsigned int flags = 0; ///< netdevice(7)
    int family = 0;         ///< AF_INET or AF_INET6
    std::string address;    ///< numeric text, without a scope
};

/// What the kernel has now, in its order; empty if it cannot be asked.
std::vector<LinkAddress> listLinkAddresses();

/// Of these addresses the ones at which the appliance is reached, IPv4 before IPv6: all that are
/// neither loopback, link-local nor a PPP link's, or the configured ones and no other. A configured
/// address is up if an interface that is up has it, or if it is in 127/8.
/// \param selector  the OLIB_NET_SELECT_ bits
std::vector<OLIBNetInterface> selectAddresses(const std::vector<LinkAddress> &links,
                                              const ApplianceConfig &config, int selector);

/// The local IPv4 address of the PPP link `pppUNIT`; "" if it is not up, or if the appliance serves
/// only on certain addresses (what selectAddresses() gives is then all there is).
std::string pppAddress(const std::vector<LinkAddress> &links, const ApplianceConfig &config,
                       int unit);

} // namespace OvraPlatform
