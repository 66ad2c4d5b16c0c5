// SPDX-License-Identifier: Apache-2.0
#include "host/link_addresses.h"

#include <ovrabase/file.h>
#include <ovradrcore/log.h>

#include <arpa/inet.h>
#include <ifaddrs.h>
#include <net/if.h>
#include <netinet/in.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string_view>

namespace OvraPlatform {

namespace {

constexpr int kMaxPppLinks = 32;

/// An address in binary: its family and its bytes.
struct BinaryAddress {
    int family = AF_UNSPEC;
    in6_addr bytes{};
};

BinaryAddress parseAddress(const std::string &text) {
    BinaryAddress address;
    if (inet_pton(AF_INET, text.c_str(), &address.bytes) == 1) {
        address.family = AF_INET;
    } else if (inet_pton(AF_INET6, text.c_str(), &address.bytes) == 1) {
        address.family = AF_INET6;
    }
    return address;
}

bool sameAddress(const std::string &left, const std::string &right) {
    const BinaryAddress a = parseAddress(left);
    const BinaryAddress b = parseAddress(right);
    return a.family == b.family && std::memcmp(&a.bytes, &b.bytes, sizeof a.bytes) == 0;
}

bool isIpv4Loopback(const std::string &address) {
    const BinaryAddress binary = parseAddress(address);
    return binary.family == AF_INET && binary.bytes.s6_addr[0] == 127;
}

/// Loopback, link-local (RFC 3927, RFC 4291) and unspecified addresses reach no other machine.
bool isReachableFromOutside(const std::string &address) {
    const BinaryAddress binary = parseAddress(address);
    const std::uint8_t *const bytes = binary.bytes.s6_addr;
    if (binary.family == AF_INET) {
        return bytes[0] != 127 && bytes[0] != 0 && !(bytes[0] == 169 && bytes[1] == 254);
    }
    return binary.family == AF_INET6 && IN6_IS_ADDR_LOOPBACK(&binary.bytes) == 0 &&
           IN6_IS_ADDR_LINKLOCAL(&binary.bytes) == 0 && IN6_IS_ADDR_UNSPECIFIED(&binary.bytes) == 0;
}

bool isPpp(const std::string &name) {
    return name.size() > 3 && name.compare(0, 3, "ppp") == 0 &&
           name.find_first_not_of("0123456789", 3) == std::string::npos;
}

bool isUp(const LinkAddress &link) {
    return (link.flags & IFF_UP) != 0 && (link.flags & IFF_RUNNING) != 0;
}

OLIBNetInterface makeEntry(const std::string &name, const std::string &address, bool up) {
    OLIBNetInterface entry{};
    std::snprintf(entry.name, sizeof entry.name, "%s", name.c_str());
    std::snprintf(entry.address, sizeof entry.address, "%s", address.c_str());
    entry.status = up ? OLIB_NET_STATUS_UP : OLIB_NET_STATUS_DOWN;
    return entry;
}

OLIBNetInterface configuredEntry(const std::vector<LinkAddress> &links,
                                 const std::string &address) {
    bool up = isIpv4Loopback(address);
    std::string name = up ? "lo" : "";
    for (const LinkAddress &link : links) {
        if (sameAddress(link.address, address)) {
            name = link.interface;
            up = up || isUp(link);
        }
    }
    return makeEntry(name, address, up);
}

} // namespace

std::vector<LinkAddress> listLinkAddresses() {
    ifaddrs *raw = nullptr;
    if (getifaddrs(&raw) != 0) {
        OVRA_ERR("Cannot list the network interfaces: %s.", OvraBase::errnoText(errno).c_str());
        return {};
    }
    const std::unique_ptr<ifaddrs, decltype(&freeifaddrs)> list(raw, freeifaddrs);
    std::vector<LinkAddress> links;
    for (const ifaddrs *entry = list.get(); entry != nullptr; entry = entry->ifa_next) {
        const int family = entry->ifa_addr == nullptr ? AF_UNSPEC : entry->ifa_addr->sa_family;
        std::array<char, INET6_ADDRSTRLEN> text{};
        if (family == AF_INET) {
            sockaddr_in address{};
            std::memcpy(&address, entry->ifa_addr, sizeof address);
            inet_ntop(family, &address.sin_addr, text.data(), text.size());
        } else if (family == AF_INET6) {
            sockaddr_in6 address{};
            std::memcpy(&address, entry->ifa_addr, sizeof address);
            inet_ntop(family, &address.sin6_addr, text.data(), text.size());
        } else {
            continue;
        }
        links.push_back({entry->ifa_name, entry->ifa_flags, family, text.data()});
    }
    return links;
}

std::vector<OLIBNetInterface> selectAddresses(const std::vector<LinkAddress> &links,
                                              const ApplianceConfig &config, int selector) {
    std::vector<OLIBNetInterface> entries;
    for (const auto &[bit, family] :
         {std::pair(OLIB_NET_SELECT_IPV4, AF_INET), std::pair(OLIB_NET_SELECT_IPV6, AF_INET6)}) {
        if ((selector & bit) == 0) {
            continue;
        }
        for (const std::string &address : config.addresses) {
            if (parseAddress(address).family == family) {
                entries.push_back(configuredEntry(links, address));
            }
        }
        for (const LinkAddress &link : links) {
            if (config.servesAllAddresses && link.family == family &&
                (link.flags & IFF_LOOPBACK) == 0 && !isPpp(link.interface) &&
                isReachableFromOutside(link.address)) {
                entries.push_back(makeEntry(link.interface, link.address, isUp(link)));
            }
        }
    }
    return entries;
}

std::string pppAddress(const std::vector<LinkAddress> &links, const ApplianceConfig &config,
                       int unit) {
    if (!config.servesAllAddresses) {
        return {};
    }
    const std::string name = "ppp" + std::to_string(unit);
    const auto link = std::find_if(links.begin(), links.end(), [&name](const LinkAddress &entry) {
        return entry.interface == name && entry.family == AF_INET && isUp(entry);
    });
    return link == links.end() ? std::string() : link->address;
}

} // namespace OvraPlatform

int OLIBNetGetInterfaceInfo(OLIBNetInterface *table, int size, int selector) {
    if (table == nullptr || size < 0) {
        return -1;
    }
    const std::vector<OLIBNetInterface> entries = OvraPlatform::selectAddresses(
        OvraPlatform::listLinkAddresses(), OvraPlatform::readApplianceConfig(), selector);
    const std::size_t count = std::min(entries.size(), static_cast<std::size_t>(size));
    std::copy_n(entries.begin(), count, table);
    return static_cast<int>(count);
}

int OVRAPPPoECheckStatus(int index) {
    return OvraPlatform::pppAddress(OvraPlatform::listLinkAddresses(),
                                    OvraPlatform::readApplianceConfig(), index - 1)
                   .empty()
               ? 0
               : 1;
}

int OVRAPPPoeNetInfoGet(char *buffer, int size, int /*unit*/, int /*flags*/) {
    if (buffer == nullptr || size <= 0) {
        return -1;
    }
    const std::vector<OvraPlatform::LinkAddress> links = OvraPlatform::listLinkAddresses();
    const OvraPlatform::ApplianceConfig config = OvraPlatform::readApplianceConfig();
    for (int unit = 0; unit < OvraPlatform::kMaxPppLinks; ++unit) {
        const std::string address = OvraPlatform::pppAddress(links, config, unit);
        if (address.empty()) {
            continue;
        }
        if (address.size() >= static_cast<std::size_t>(size)) {
            return -1;
        }
        std::memcpy(buffer, address.c_str(), address.size() + 1);
        return 0;
    }
    return -1;
}
