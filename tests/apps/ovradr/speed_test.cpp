// SPDX-License-Identifier: Apache-2.0
#include "program.h"
#include "rate.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <gtest/gtest.h>

namespace OvradrTest {

TEST(SpeedCommand, EveryEndpointThatWasTriedIsNamedWithItsOutcome) {
    ASSERT_EQ(run({"setup", "--address", "127.0.0.1,127.0.0.2"}).exit, 0);
    OvraTest::RemoteNode remote;
    remote.trust();
    OvraTest::addCred("node_cred", "n1", "c1", "https", remote.port(), "s1");
    remote.answer("test_download_speed", R"({"success":false,"error":{"code":407}})");
    const Result none = run({"speed", "n1"});
    EXPECT_EQ(none.exit, 1);
    for (const char *endpoint : {"https://127.0.0.1:5001", "http://127.0.0.1:5000",
                                 "https://127.0.0.2:5001", "http://127.0.0.2:5000"}) {
        EXPECT_NE(none.err.find(endpoint), std::string::npos) << none.err;
    }
    int asked = 0;
    remote.before("test_download_speed", [&] {
        if (++asked == 3) {
            remote.answer("test_download_speed",
                          R"({"success":true,"data":{"speed":"94.1 Mbit/s"}})");
        }
    });
    const Json::Value data = run({"speed", "n1", "--json"}).json()["data"];
    EXPECT_EQ(data["bits_per_second"], 94.1e6);
    ASSERT_EQ(data["endpoints"].size(), 3U);
    EXPECT_EQ(data["endpoints"][0]["code"], 407);
    EXPECT_EQ(data["endpoints"][2]["endpoint"], "https://127.0.0.2:5001");
    EXPECT_TRUE(data["endpoints"][2]["success"].asBool());

    remote.server.refuse();
    EXPECT_EQ(run({"speed", "n1"}).exit, 3) << "the node itself";
    EXPECT_EQ(run({"speed", "--url", "file:///etc/passwd"}).exit, 3);
    EXPECT_EQ(run({"speed"}).exit, 2);
}

TEST(SpeedCommand, IsShownWithThreeFigures) {
    const std::pair<const char *, const char *> cases[] = {
        {"94.1 Mbit/s", "94.1 Mbit/s (11.8 MB/s)"},
        {"5189.6 Mbit/s", "5.19 Gbit/s (649 MB/s)"},
        {"0.0 Mbit/s", "0.00 bit/s (0.00 B/s)"},
        {"11.5 MB/s", "92.0 Mbit/s (11.5 MB/s)"},
        {"fast enough", "fast enough"},
        {"12 furlongs", "12 furlongs"},
    };
    for (const auto &[speed, text] : cases) {
        EXPECT_EQ(Ovradr::rateText(speed), text);
    }
}

} // namespace OvradrTest
