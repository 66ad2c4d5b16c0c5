// SPDX-License-Identifier: Apache-2.0
#include "service/work_queue.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>

namespace {

using OvraService::WorkQueue;
using namespace std::chrono_literals;

TEST(WorkQueue, RunsJobsSideBySide) {
    WorkQueue queue(2, {10, 10});
    std::promise<void> begun[2];
    std::promise<bool> met[2];
    for (const int self : {0, 1}) {
        EXPECT_TRUE(queue.submit(std::to_string(self), [&, self] {
            begun[self].set_value();
            met[self].set_value(begun[1 - self].get_future().wait_for(5s) ==
                                std::future_status::ready);
        }));
    }
    EXPECT_TRUE(met[0].get_future().get());
    EXPECT_TRUE(met[1].get_future().get());
}

TEST(WorkQueue, GoesOnAfterAJobThatThrows) {
    WorkQueue queue(1, {10, 10});
    std::promise<void> next;
    EXPECT_TRUE(queue.submit("a", [] { throw std::runtime_error("broken"); }));
    EXPECT_TRUE(queue.submit("a", [&next] { next.set_value(); }));
    EXPECT_EQ(next.get_future().wait_for(5s), std::future_status::ready);
}

TEST(WorkQueue, DropsWaitingJobsWhenItStopsAndTellsOfTheOneThatGoesOn) {
    WorkQueue queue(1, {10, 10});
    std::promise<void> inside;
    std::promise<void> release;
    EXPECT_TRUE(queue.submit("a", [&] {
        inside.set_value();
        release.get_future().wait();
    }));
    inside.get_future().wait();
    const auto held = std::make_shared<int>(0);
    EXPECT_TRUE(queue.submit("a", [held] { FAIL() << "a dropped job ran"; }));
    EXPECT_FALSE(queue.stop(std::chrono::steady_clock::now() + 50ms));
    EXPECT_EQ(held.use_count(), 1);
    EXPECT_FALSE(queue.submit("a", [] {}));
    release.set_value();
    EXPECT_TRUE(queue.stop(std::chrono::steady_clock::now() + 5s));
}

/// Jobs of several clients in a queue of one thread that is held up until all are there.
TEST(WorkQueue, LetsClientsTakeTurnsAndRefusesTheGreediestFirst) {
    WorkQueue queue(1, {8, 6});
    std::promise<void> inside;
    std::promise<void> release;
    EXPECT_TRUE(queue.submit("held up", [&] {
        inside.set_value();
        release.get_future().wait();
    }));
    inside.get_future().wait();
    std::string done; // by the one thread, and here, while it is held up
    std::promise<void> ended;
    const auto note = [&](char what) {
        done += what;
        if (done.size() == 11) {
            ended.set_value();
        }
    };
    const auto add = [&](char client) {
        return queue.submit(
            {client}, [=] { note(client); }, [=] { note('!'); });
    };
    for (int i = 0; i < 6; ++i) {
        EXPECT_TRUE(add('a'));
    }
    EXPECT_FALSE(add('a')) << "six are the most of one client";
    for (const char client : {'b', 'c', 'd', 'e', 'd'}) {
        EXPECT_TRUE(add(client)) << client;
    }
    EXPECT_EQ(done, "!!!") << "there was room for b and c; the others had to make it";
    release.set_value();
    ended.get_future().wait();
    EXPECT_EQ(done, "!!!abcdeada");
}

TEST(WorkQueue, LeavesAThreadToTheOthers) {
    WorkQueue queue(4, {10, 10});
    std::promise<void> others;
    const auto came = others.get_future().share();
    for (int i = 0; i < 5; ++i) {
        EXPECT_TRUE(queue.submit("a", [came] { came.wait(); }));
    }
    EXPECT_TRUE(queue.submit("b", [&] { others.set_value(); }));
    EXPECT_EQ(came.wait_for(5s), std::future_status::ready);
}

} // namespace
