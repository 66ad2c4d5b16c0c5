// SPDX-License-Identifier: Apache-2.0
#include "service/work_queue.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <stdexcept>

namespace {

using OvraService::WorkQueue;
using namespace std::chrono_literals;

TEST(WorkQueue, LetsADelayedJobHoldNoThread) {
    WorkQueue queue(1, 10);
    std::promise<std::chrono::steady_clock::time_point> late;
    std::promise<std::chrono::steady_clock::time_point> atOnce;
    const auto begun = std::chrono::steady_clock::now();
    EXPECT_TRUE(queue.submit([&late] { late.set_value(std::chrono::steady_clock::now()); }, 300ms));
    EXPECT_TRUE(queue.submit([&atOnce] { atOnce.set_value(std::chrono::steady_clock::now()); }));
    const auto lateAt = late.get_future().get();
    EXPECT_LT(atOnce.get_future().get(), lateAt);
    EXPECT_GE(lateAt - begun, 300ms);
}

TEST(WorkQueue, RunsJobsThatAreDueTogetherSideBySide) {
    WorkQueue queue(2, 10);
    std::promise<void> begun[2];
    std::promise<bool> met[2];
    for (const int self : {0, 1}) {
        EXPECT_TRUE(queue.submit(
            [&, self] {
                begun[self].set_value();
                met[self].set_value(begun[1 - self].get_future().wait_for(5s) ==
                                    std::future_status::ready);
            },
            100ms));
    }
    EXPECT_TRUE(met[0].get_future().get());
    EXPECT_TRUE(met[1].get_future().get());
}

TEST(WorkQueue, GoesOnAfterAJobThatThrows) {
    WorkQueue queue(1, 10);
    std::promise<void> next;
    EXPECT_TRUE(queue.submit([] { throw std::runtime_error("broken"); }));
    EXPECT_TRUE(queue.submit([&next] { next.set_value(); }));
    EXPECT_EQ(next.get_future().wait_for(5s), std::future_status::ready);
}

TEST(WorkQueue, DropsWaitingJobsWhenItStopsAndTellsOfTheOneThatGoesOn) {
    WorkQueue queue(1, 10);
    std::promise<void> inside;
    std::promise<void> release;
    EXPECT_TRUE(queue.submit([&] {
        inside.set_value();
        release.get_future().wait();
    }));
    inside.get_future().wait();
    const auto held = std::make_shared<int>(0);
    EXPECT_TRUE(queue.submit([held] { FAIL() << "a dropped job ran"; }));
    EXPECT_FALSE(queue.stop(std::chrono::steady_clock::now() + 50ms));
    EXPECT_EQ(held.use_count(), 1);
    EXPECT_FALSE(queue.submit([] {}));
    release.set_value();
    EXPECT_TRUE(queue.stop(std::chrono::steady_clock::now() + 5s));
}

} // namespace
