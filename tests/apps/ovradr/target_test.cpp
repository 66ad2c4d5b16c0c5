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
    const std::string longName(254, 'a');
    for (const std::string &text : {
             std::string(""),
             std::string("nas2"),
             std::string("nas2:5001"),
             std::string("ftp://nas2"),
             std::string("https:/nas2"),
             std::string("https://"),
             std::string("https://:5001"),
             std::string("https://nas2:"),
             std::string("https://nas2:0"),
             std::string("https://nas2:65536"),
             std::string("https://nas2:-1"),
             std::string("https://nas2:+80"),
             std::string("https://nas2:5001x"),
             std::string("https://nas2/path"),
             std::string("https://nas2//"),
             std::string("https://nas2?x"),
             std::string("https://nas2#x"),
             std::string("https://bob:pw@nas2"),
             std::string("https://nas 2"),
             std::string("https://nas2\r\nX: 1"),
             std::string("https://nas2\0.evil", 18),
             std::string("https://n\xC3\xA4s"),
             std::string("https://2001:db8::7"),
             std::string("https://[2001:db8::7"),
             std::string("https://[nas2]"),
             std::string("https://[fe80::1%eth0]"),
             std::string("https://[::1]x"),
             std::string("https://-nas2"),
             "https://" + longName,
             std::string("flk:"),
             std::string("flk:a/b"),
         }) {
        const auto conn = parseTarget(text);
        ASSERT_FALSE(conn) << text;
        EXPECT_EQ(conn.error().exit, ExitCode::kUsage) << text;
    }
}

} // namespace Ovradr
