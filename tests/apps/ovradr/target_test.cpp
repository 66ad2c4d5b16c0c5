// SPDX-License-Identifier: Apache-2.0
#include "target.h"

#include <gtest/gtest.h>

namespace Ovradr {

TEST(Target, IsReadAsPeopleWriteIt) {
    const struct {
        const char *text;
        OvraDRNode::Conn conn;
        const char *written;
    } cases[] = {
        {"https://nas2", {"nas2", "https", 5001}, "https://nas2:5001"},
        {"http://nas2", {"nas2", "http", 5000}, "http://nas2:5000"},
        {"HTTPS://NAS2.Example:8443/",
         {"nas2.example", "https", 8443},
         "https://nas2.example:8443"},
        {"https://192.0.2.7:1", {"192.0.2.7", "https", 1}, "https://192.0.2.7:1"},
        {"http://[2001:DB8::0:7]:65535",
         {"2001:db8::7", "http", 65535},
         "http://[2001:db8::7]:65535"},
        {"https://[::1]", {"::1", "https", 5001}, "https://[::1]:5001"},
        {"flk:my-nas", OvraDRNode::Conn::farlink("my-nas"), "flk:my-nas"},
    };
    for (const auto &each : cases) {
        const auto conn = parseTarget(each.text);
        ASSERT_TRUE(conn) << each.text << ": " << conn.error().message;
        EXPECT_EQ(*conn, each.conn) << each.text;
        EXPECT_EQ(targetText(*conn), each.written);
    }
}

TEST(Target, IsRefusedWhenAnythingInItWouldBeLost) {
    const std::string refused[] = {"",
                                   "nas2",
                                   "nas2:5001",
                                   "ftp://nas2",
                                   "https:/nas2",
                                   "https://",
                                   "https://:5001",
                                   "https://nas2:",
                                   "https://nas2:0",
                                   "https://nas2:65536",
                                   "https://nas2:-1",
                                   "https://nas2:+80",
                                   "https://nas2:5001x",
                                   "https://nas2/path",
                                   "https://nas2//",
                                   "https://nas2?x",
                                   "https://nas2#x",
                                   "https://bob:pw@nas2",
                                   "https://nas 2",
                                   "https://nas2\r\nX: 1",
                                   "https://n\xC3\xA4s",
                                   "https://2001:db8::7",
                                   "https://[2001:db8::7",
                                   "https://[nas2]",
                                   "https://[fe80::1%eth0]",
                                   "https://[::1]x",
                                   "https://-nas2",
                                   "flk:",
                                   "flk:a/b",
                                   {"https://nas2\0.evil", 18},
                                   "https://" + std::string(254, 'a')};
    for (const std::string &text : refused) {
        const auto conn = parseTarget(text);
        ASSERT_FALSE(conn) << text;
        EXPECT_EQ(conn.error().exit, ExitCode::kUsage) << text;
    }
}

} // namespace Ovradr
