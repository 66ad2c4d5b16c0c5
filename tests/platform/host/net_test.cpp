// SPDX-License-Identifier: Apache-2.0
#include "host/link_addresses.h"
#include "platform/own_files.h"

#include <ovracore/ovracore.h>
#include <ovranet/ovranet.h>

#include <net/if.h>
#include <netinet/in.h>

#include <array>
#include <cstdlib>
#include <string>
#include <vector>

using namespace OvraPlatform;

namespace {

constexpr unsigned int kUp = IFF_UP | IFF_RUNNING;
constexpr int kBoth = OLIB_NET_SELECT_IPV4 | OLIB_NET_SELECT_IPV6;

const std::vector<LinkAddress> kLinks = {
    {"lo", kUp | IFF_LOOPBACK, AF_INET, "127.0.0.1"},
    {"eth0", kUp, AF_INET, "192.0.2.2"},
    {"eth1", IFF_UP, AF_INET, "192.0.2.130"},
    {"eth2", kUp, AF_INET, "169.254.7.7"},
    {"wg0", kUp | IFF_POINTOPOINT, AF_INET, "198.51.100.4"},
    {"ppp0", kUp | IFF_POINTOPOINT, AF_INET, "203.0.113.9"},
    {"lo", kUp | IFF_LOOPBACK, AF_INET6, "::1"},
    {"eth0", kUp, AF_INET6, "fe80::1"},
    {"eth0", kUp, AF_INET6, "2001:db8::2"},
    {"pppoe-lan", kUp, AF_INET6, "fd00::2"},
};

std::string toText(const std::vector<OLIBNetInterface> &entries) {
    std::string text;
    for (const OLIBNetInterface &entry : entries) {
        text += std::string(entry.name) + "=" + entry.address +
                (entry.status == OLIB_NET_STATUS_UP ? " " : "(down) ");
    }
    return text;
}

ApplianceConfig servingAt(const std::vector<std::string> &addresses) {
    return {.servesAllAddresses = false, .addresses = addresses};
}

TEST(LinkAddresses, AreThoseThatOtherMachinesReachIpv4FirstOrTheConfiguredOnes) {
    EXPECT_EQ(toText(selectAddresses(kLinks, {}, kBoth)),
              "eth0=192.0.2.2 eth1=192.0.2.130(down) wg0=198.51.100.4 eth0=2001:db8::2 "
              "pppoe-lan=fd00::2 ");
    EXPECT_EQ(toText(selectAddresses(kLinks, {}, OLIB_NET_SELECT_IPV6)),
              "eth0=2001:db8::2 pppoe-lan=fd00::2 ");
    EXPECT_EQ(toText(selectAddresses(kLinks, {}, 0)), "");
    EXPECT_EQ(toText(selectAddresses(kLinks,
                                     servingAt({"2001:DB8:0::2", "127.0.1.2", "192.0.2.130",
                                                "192.0.2.2", "192.0.2.99"}),
                                     kBoth)),
              "lo=127.0.1.2 eth1=192.0.2.130(down) eth0=192.0.2.2 =192.0.2.99(down) "
              "eth0=2001:DB8:0::2 ");
    EXPECT_EQ(toText(selectAddresses(kLinks, servingAt({}), kBoth)), "");
    // The PPP link is kept apart.
    EXPECT_EQ(pppAddress(kLinks, {}, 0), "203.0.113.9");
    EXPECT_EQ(pppAddress(kLinks, {}, 1), "");
    EXPECT_EQ(pppAddress({{"ppp0", IFF_UP, AF_INET, "203.0.113.9"}}, {}, 0), "");
    EXPECT_EQ(pppAddress(kLinks, servingAt({"192.0.2.2"}), 0), "");
}

struct Net : OvraTest::OwnFiles {
    static bool ip(const std::string &words) {
        return std::system(("/usr/sbin/ip " + words).c_str()) == 0;
    }
    static std::string interfaces() {
        std::array<OLIBNetInterface, 32> table{};
        const int count = OLIBNetGetInterfaceInfo(table.data(), 32, kBoth);
        return count < 0 ? "failed" : toText({table.begin(), table.begin() + count});
    }
};

TEST_F(Net, ListsWhatTheKernelHas) {
    if (std::getenv("OVRADR_LAB_WAY") == std::string("proot") ||
        !ip("link add ppp0 type veth peer lan0")) {
        GTEST_SKIP() << "this machine does not allow a network of one's own";
    }
    ASSERT_TRUE(ip("addr add 192.0.2.5/24 dev lan0") && ip("addr add 203.0.113.5/32 dev ppp0"));
    EXPECT_EQ(interfaces(), "lan0=192.0.2.5(down) ");
    EXPECT_EQ(OVRAPPPoECheckStatus(1), 0);
    ASSERT_TRUE(ip("link set ppp0 up") && ip("link set lan0 up"));
    EXPECT_EQ(interfaces(), "lan0=192.0.2.5 ");
    EXPECT_EQ(OVRAPPPoECheckStatus(1), 1);
    EXPECT_EQ(OVRAPPPoECheckStatus(2), 0);
    std::array<char, 32> address{};
    EXPECT_EQ(OVRAPPPoeNetInfoGet(address.data(), 32, 0, 0), 0);
    EXPECT_STREQ(address.data(), "203.0.113.5");
    EXPECT_NE(OVRAPPPoeNetInfoGet(address.data(), 11, 0, 0), 0);
}

TEST_F(Net, ListsTheConfiguredAddressesAndFillsNoMoreThanTheTableHolds) {
    OvraTest::writeFile(kConfigFile, "address=\"127.0.1.2,127.0.1.3\"\n");
    EXPECT_EQ(interfaces(), "lo=127.0.1.2 lo=127.0.1.3 ");
    std::array<OLIBNetInterface, 2> table{};
    EXPECT_EQ(OLIBNetGetInterfaceInfo(table.data(), 1, kBoth), 1);
    EXPECT_STREQ(table[1].address, "");
    EXPECT_EQ(OLIBNetGetInterfaceInfo(nullptr, 1, kBoth), -1);
}

} // namespace
