// SPDX-License-Identifier: Apache-2.0
#include "lanes.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <memory>
#include <stdexcept>

namespace {

using Ovradrd::Lane;
using namespace std::chrono_literals;

/// Holds a thread of a lane until it is told to let go.
class Plug {
public:
    Lane::Job job() {
        return [this] {
            inside.set_value();
            release.get_future().wait();
        };
    }
    void waitUntilInside() { inside.get_future().wait(); }
    void letGo() { release.set_value(); }

private:
    std::promise<void> inside;
    std::promise<void> release;
};

TEST(Lane, refusesWhatDoesNotFitInItsQueue) {
    Lane lane(1, 2);
    Plug plug;
    ASSERT_TRUE(lane.submit(plug.job()));
    plug.waitUntilInside();
    std::atomic<int> ran = 0;
    EXPECT_TRUE(lane.submit([&ran] { ++ran; }));
    EXPECT_TRUE(lane.submit([&ran] { ++ran; }));
    EXPECT_FALSE(lane.submit([&ran] { ++ran; }));
    plug.letGo();
    std::promise<void> last;
    while (!lane.submit([&last] { last.set_value(); })) {
    }
    last.get_future().wait();
    EXPECT_EQ(ran, 2);
}

TEST(Lane, letsADelayedJobHoldNoThread) {
    Lane lane(1, 10);
    std::promise<std::chrono::steady_clock::time_point> late;
    std::promise<std::chrono::steady_clock::time_point> atOnce;
    const auto begun = std::chrono::steady_clock::now();
    lane.submit([&late] { late.set_value(std::chrono::steady_clock::now()); }, 300ms);
    lane.submit([&atOnce] { atOnce.set_value(std::chrono::steady_clock::now()); });
    const auto lateAt = late.get_future().get();
    EXPECT_LT(atOnce.get_future().get(), lateAt);
    EXPECT_GE(lateAt - begun, 300ms);
}

TEST(Lane, runsJobsThatAreDueTogetherSideBySide) {
    Lane lane(2, 10);
    std::promise<void> begun[2];
    std::promise<bool> met[2];
    for (const int self : {0, 1}) {
        lane.submit(
            [&, self] {
                begun[self].set_value();
                met[self].set_value(begun[1 - self].get_future().wait_for(5s) ==
                                    std::future_status::ready);
            },
            100ms);
    }
    EXPECT_TRUE(met[0].get_future().get());
    EXPECT_TRUE(met[1].get_future().get());
}

TEST(Lane, goesOnAfterAJobThatThrows) {
    Lane lane(1, 10);
    std::promise<void> next;
    lane.submit([] { throw std::runtime_error("broken"); });
    lane.submit([&next] { next.set_value(); });
    EXPECT_EQ(next.get_future().wait_for(5s), std::future_status::ready);
}

TEST(Lane, dropsWaitingJobsWhenItStopsAndTellsOfTheOneThatGoesOn) {
    Lane lane(1, 10);
    Plug plug;
    lane.submit(plug.job());
    plug.waitUntilInside();
    const auto held = std::make_shared<int>(0);
    lane.submit([held] { FAIL() << "a dropped job ran"; });
    EXPECT_FALSE(lane.stop(std::chrono::steady_clock::now() + 50ms));
    EXPECT_EQ(held.use_count(), 1);
    EXPECT_FALSE(lane.submit([] {}));
    plug.letGo();
    EXPECT_TRUE(lane.stop(std::chrono::steady_clock::now() + 5s));
}

} // namespace
