// SPDX-License-Identifier: Apache-2.0
#include <ovradrcore/no_fork.h>
#include <ovradrcore/sqlite_db.h>

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <thread>

using namespace OvraDRCore;
using namespace std::chrono_literals;

namespace {

/// How long a fork takes whose child enters a section, in two threads at once.
std::chrono::steady_clock::duration forkTime() {
    const auto start = std::chrono::steady_clock::now();
    const pid_t child = fork();
    if (child == 0) {
        alarm(30);
        const NoFork here;
        std::thread([] { const NoFork there; }).join();
        _exit(0);
    }
    const auto took = std::chrono::steady_clock::now() - start;
    int status = 1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
    return took;
}

} // namespace

TEST(NoFork, AForkWaitsForOtherThreadsInASectionAndNeverForLong) {
    const struct {
        const char *others; ///< what they do
        std::chrono::milliseconds section;
        std::chrono::milliseconds least;
        std::chrono::milliseconds most;
    } cases[] = {
        {"short work", 500ms, 200ms, 4s},
        {"one section after the other", 1ms, 0ms, 4s},
        {"endless work", 1h, 4s, 25s},
    };
    for (const auto &[others, section, least, most] : cases) {
        std::atomic<int> inside{0};
        std::atomic<bool> stop{false};
        const auto work = [&, length = section] {
            for (bool first = true; !stop; first = false) {
                const NoFork here;
                inside += first ? 1 : 0;
                const auto end = std::chrono::steady_clock::now() + length;
                while (!stop && std::chrono::steady_clock::now() < end) {
                    std::this_thread::sleep_for(1ms);
                }
            }
        };
        std::thread one(work);
        std::thread two(work);
        while (inside < 2) {
            std::this_thread::yield();
        }
        const auto took = forkTime();
        EXPECT_GE(took, least) << others;
        EXPECT_LT(took, most) << others;
        stop = true;
        one.join();
        two.join();
    }
}

TEST(NoFork, AForkWaitsNeitherForItsOwnSectionsNorForADatabaseThatIsWaitedFor) {
    constexpr char kPath[] = "/usr/ovra/no_fork.db";
    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(kPath, &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    std::thread waiting([&] { EXPECT_EQ(SqliteDB(kPath, 8, "t").GetSchemaVersion(), -1); });
    std::this_thread::sleep_for(200ms);
    {
        const NoFork outer;
        const NoFork inner;
        EXPECT_LT(forkTime(), 4s);
    }
    sqlite3_close(other);
    waiting.join();
}
