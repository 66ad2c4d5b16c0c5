// SPDX-License-Identifier: Apache-2.0
#include "target.h"

#include <gtest/gtest.h>

namespace Ovradr {

TEST(Target, IsReadAsPeopleWriteIt) {
    const std::tuple<const char *, OvraDRNode::Conn, const char *> cases[] = {
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
        {" \thttps://nas2\r\n", {"nas2", "https", 5001}, "https://nas2:5001"},
        {"https://[fe80::1%eth0]", {"fe80::1%eth0", "https", 5001}, "https://[fe80::1%eth0]:5001"},
        {"https://[FE80::1%25eth0]",
         {"fe80::1%eth0", "https", 5001},
         "https://[fe80::1%eth0]:5001"},
        {"https://N\u00c4S2.example:7",
         {"xn--ns2-qla.example", "https", 7},
         "https://xn--ns2-qla.example:7"},
        {"flk:my-nas", OvraDRNode::Conn::farlink("my-nas"), "flk:my-nas"},
    };
    for (const auto &[text, conn, written] : cases) {
        const auto parsed = parseTarget(text);
        ASSERT_TRUE(parsed) << text << ": " << parsed.error().message;
        EXPECT_EQ(*parsed, conn) << text;
        EXPECT_EQ(targetText(*parsed), written);
    }
}

TEST(Target, IsRefusedWhenAnythingInItWouldBeLost) {
    std::vector<std::string> refused{"https://" + std::string(254, 'a'),
                                     {"https://nas2\0.evil", 18}};
    for (const char *text :
         {"", "nas2", "nas2:5001", "ftp://nas2", "https:/nas2", "flk:", "flk:a/b"}) {
        refused.emplace_back(text);
    }
    for (const char *authority :
         {"",        ":5001",       "nas2:",        "nas2:0",    "nas2:65536",
          "nas2:-1", "nas2:+80",    "nas2:5001x",   "nas2/path", "nas2//",
          "nas2?x",  "nas2#x",      "bob:pw@nas2",  "nas 2",     "nas2\r\nX: 1",
          "n\xC3s",  "2001:db8::7", "[2001:db8::7", "[nas2]",    "[fe80::1]",
          "[::1]x",  "-nas2",       "10.77.2",      "a\u2028b",  "[2001:db8::1%eth0]"}) {
        refused.push_back(std::string("https://") + authority);
    }
    for (const std::string &text : refused) {
        const auto conn = parseTarget(text);
        ASSERT_FALSE(conn) << text;
        EXPECT_EQ(conn.error().exit, ExitCode::kUsage) << text;
    }
    EXPECT_EQ(parseTarget(" nas2:7").error().hint,
              "Write https://nas2:7, or http:// for plain HTTP.");
}

} // namespace Ovradr
