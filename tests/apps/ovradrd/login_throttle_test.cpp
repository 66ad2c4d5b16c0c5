// SPDX-License-Identifier: Apache-2.0
#include "login_throttle.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <string>
#include <vector>

using Ovradrd::LoginThrottle;
using std::chrono::milliseconds;

namespace {

struct Throttle : testing::Test {
    /// The delay of a log-in in milliseconds; -1: rejected.
    long admit(const std::string &account, const std::string &address) {
        const auto wait = throttle.admit(account, address);
        return wait ? static_cast<long>(wait->count()) : -1;
    }
    /// Log-ins that wait as required and then fail; the delay of the last.
    long fail(int times, const std::string &account, const std::string &address) {
        long wait = 0;
        for (int i = 0; i < times; ++i) {
            wait = admit(account, address);
            now += milliseconds(wait);
        }
        return wait;
    }

    LoginThrottle::TimePoint now{std::chrono::hours(1)};
    LoginThrottle throttle{[this] { return now; }};
};

TEST_F(Throttle, DoublesTheWaitAfterThreeFailures) {
    for (const long wait : {0, 0, 0, 250, 500, 1000, 2000, 4000, 8000, 8000, 8000}) {
        EXPECT_EQ(fail(1, "ann", "192.0.2.1"), wait);
    }
    EXPECT_EQ(admit("bob", "192.0.2.2"), 0);
}

TEST_F(Throttle, CountsForTheAccountAndForTheAddressOrIpv6NetworkByThemselves) {
    for (const std::string i : {"0", "1", "2", "3", "4"}) {
        fail(1, "ann", "192.0.2." + i);
        fail(1, "user" + i, "198.51.100.1");
        fail(1, "other" + i, "2001:db8:0:7::" + i);
    }
    EXPECT_EQ(admit("ann", "192.0.2.99"), 1000);
    EXPECT_EQ(admit("bob", "192.0.2.0"), 0);
    EXPECT_EQ(admit("bill", "198.51.100.1"), 1000);
    EXPECT_EQ(admit("sue", "2001:db8:0:7:ffff::1"), 1000);
    EXPECT_EQ(admit("tom", "2001:db8:0:8::1"), 0);
}

TEST_F(Throttle, SpacesLoginsThatComeAtOnceAndTurnTheRestAway) {
    fail(8, "ann", "192.0.2.1");
    for (const long wait : {8000, 16000, -1}) {
        EXPECT_EQ(admit("ann", "192.0.2.1"), wait);
    }
    EXPECT_EQ(admit("ann", "192.0.2.2"), -1);
    now += std::chrono::seconds(8);
    EXPECT_EQ(admit("ann", "192.0.2.1"), 16000);
}

TEST_F(Throttle, AMinuteTakesOneFailureBack) {
    fail(5, "ann", "192.0.2.1");
    now += std::chrono::seconds(119);
    EXPECT_EQ(admit("ann", "192.0.2.1"), 0); // long after the last one, but it counts: 4 + 1
    EXPECT_EQ(admit("ann", "192.0.2.1"), 1000);
    now += std::chrono::hours(1);
    EXPECT_EQ(fail(3, "ann", "192.0.2.1"), 0);
}

TEST_F(Throttle, ASuccessClearsTheAccountButNotTheAddress) {
    fail(5, "ann", "192.0.2.1");
    admit("ann", "192.0.2.9");
    throttle.recordSuccess("ann", "192.0.2.9");
    EXPECT_EQ(admit("ann", "192.0.2.9"), 0);
    // Successes with one's own account allow no more guesses at others.
    fail(1, "mallory", "192.0.2.1");
    throttle.recordSuccess("mallory", "192.0.2.1");
    EXPECT_EQ(admit("bob", "192.0.2.1"), 1000);
}

TEST_F(Throttle, AForgivenLoginIsNotCountedAndClearsNothing) {
    fail(4, "ann", "192.0.2.1");
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(fail(1, "ann", "192.0.2.1"), 500);
        throttle.withdraw("ann", "192.0.2.1");
    }
}

TEST_F(Throttle, AFloodOfNamesDoesNotMakeItForgetTheAccountThatIsGuessed) {
    for (int i = 0; i < 6; ++i) {
        fail(1, "ann", "192.0.2.1");
        fail(1, "zoe", "192.0.2.2");
    }
    for (int i = 0; i < 6000; ++i) {
        admit("name" + std::to_string(i),
              "10.0." + std::to_string(i / 250) + "." + std::to_string(i % 250));
    }
    EXPECT_GE(admit("ann", "203.0.113.1"), 1000);
    EXPECT_GE(admit("zoe", "203.0.113.2"), 1000);
}

TEST(ThrottleThreads, CountEveryFailure) {
    LoginThrottle throttle;
    std::vector<std::future<void>> threads(4);
    for (auto &thread : threads) {
        thread = std::async(std::launch::async, [&] { throttle.admit("ann", "192.0.2.1"); });
    }
    threads.clear(); // waits for them
    const auto wait = throttle.admit("ann", "192.0.2.1");
    ASSERT_TRUE(wait);
    EXPECT_GT(*wait, milliseconds(250)); // the fourth waits for 250 ms, the fifth after it
}

} // namespace
