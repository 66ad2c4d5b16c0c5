// SPDX-License-Identifier: Apache-2.0
#include <ovrabase/address.h>

#include <gtest/gtest.h>

#include <utility>

using namespace OvraBase;
using namespace std::string_view_literals;

TEST(Address, OnlyANumericAddressIsOne) {
    for (const char *text : {"10.0.0.1", "::1", "fe80::1", "::ffff:10.0.0.1"}) {
        EXPECT_TRUE(isNumericAddress(text)) << text;
    }
    for (const char *text :
         {"", "10.0.1", "10.0.0.256", "[::1]", "fe80::1%lo", "nas", "10.0.0.1 "}) {
        EXPECT_FALSE(isNumericAddress(text)) << text;
    }
    EXPECT_FALSE(isNumericAddress(std::string("10.0.0.1\0.evil", 14)));
}

TEST(Address, IsTheSameTextAfterItWasASocketAddress) {
    for (const auto &[text, shown] : {std::pair{"192.0.2.7", "192.0.2.7"},
                                      {"2001:DB8:0::7", "2001:db8::7"},
                                      {"::ffff:192.0.2.7", "192.0.2.7"}}) {
        const auto address = parseAddress(text, 5001);
        ASSERT_TRUE(address) << text;
        EXPECT_EQ(addressText(address->get()), shown);
    }
    EXPECT_EQ(addressText(nullptr), "");
}

TEST(Address, OneSubscriberIsOneClient) {
    EXPECT_EQ(clientKey("192.0.2.7"), "192.0.2.7");
    EXPECT_NE(clientKey("192.0.2.7"), clientKey("192.0.2.8"));
    EXPECT_EQ(clientKey("2001:db8:0:1::7"), clientKey("2001:db8:0:1:ffff::8"));
    EXPECT_NE(clientKey("2001:db8:0:1::7"), clientKey("2001:db8:0:2::7"));
    EXPECT_NE(clientKey("::ffff:192.0.2.7"), clientKey("::ffff:192.0.2.8"))
        << "all of IPv4 would be one client";
}

TEST(Address, AHostHasOneSpelling) {
    EXPECT_EQ(normalizeIpv6("[2001:DB8::0:1]"), "2001:db8::1");
    EXPECT_EQ(normalizeIpv6("[FE80::0:1%eth0]"), "fe80::1%eth0");
    for (const char *text :
         {"2001:db8::1%eth0", "fe80::1%", "fe80::1%a/b", "fe80::1%sixteencharacter"}) {
        EXPECT_EQ(normalizeIpv6(text), "") << text;
    }
    EXPECT_EQ(joinHostPort("2001:db8::1", 5001), "[2001:db8::1]:5001");
    EXPECT_EQ(joinHostPort("nas.example", 80), "nas.example:80");
    EXPECT_EQ(toLower("NAS-1.Example"), "nas-1.example");
    // A name holds nothing that would mean more in a URL.
    for (const char *name : {"nas", "nas-1.example", "10.0.0.1", "a_b"}) {
        EXPECT_TRUE(isHostName(name)) << name;
    }
    for (const auto name :
         {""sv, ".nas"sv, "-nas"sv, "a b"sv, "a@b"sv, "a/b"sv, "a:1"sv, "n\xC3\xA4s"sv, "a\0b"sv}) {
        EXPECT_FALSE(isHostName(name)) << name;
    }
    EXPECT_TRUE(isHostName(std::string(253, 'a')));
    EXPECT_FALSE(isHostName(std::string(254, 'a')));
}
