// SPDX-License-Identifier: Apache-2.0
#include "refusal_log.h"
#include "support/log_capture.h"

#include <gtest/gtest.h>

TEST(RefusalLog, ShowsTheFirstOfAClientAndCountsTheOthers) {
    std::chrono::steady_clock::time_point now{std::chrono::hours(1)};
    Ovradrd::RefusalLog refusals([&now] { return now; });
    const LogCapture log;
    for (int i = 0; i < 1000; ++i) { // one subscriber, and many
        refusals.note("2001:db8::" + std::to_string(i), 105, "a call");
        refusals.note("192.0." + std::to_string(i / 250) + "." + std::to_string(i % 250), 109, "b");
    }
    refusals.note("192.0.0.1", 119, "c"); // of a code that this client has not had
    EXPECT_EQ(log.count("a call from [2001:db8::4] was refused with [105]"), 1);
    EXPECT_EQ(log.count("refused with [105]"), 5);
    EXPECT_LE(log.lines().size(), 5U + 256U + 5U + 5U);
    refusals.tell();
    EXPECT_EQ(log.count("more calls"), 0) << "the minute is not over";
    now += std::chrono::seconds(60);
    refusals.tell();
    EXPECT_EQ(log.count("[995] more calls from [2001:db8::/64] were refused with [105]"), 1);
    EXPECT_EQ(log.count("more calls from [other clients]"), 1);
    refusals.note("2001:db8::1", 105, "a new minute");
    EXPECT_EQ(log.count("a new minute"), 1);
}
