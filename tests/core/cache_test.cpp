// SPDX-License-Identifier: Apache-2.0
#include "cache_bucket.h"
#include "clock.h"
#include "support/log_capture.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/json.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstring>
#include <fstream>
#include <functional>
#include <random>
#include <thread>

using namespace OvraDRCore;

namespace {

constexpr const char *kDir = "/tmp/.ovradrcache";
constexpr const char *kPath = "/tmp/.ovradrcache//c";
constexpr const char *kTarget = "/tmp/.ovradrcache/target";
constexpr long kLifetime = 5;
constexpr std::int64_t kDay = 86400;

std::int64_t fakeNow = 0;

/// Shared by the test process and its children.
struct Counters {
    std::atomic<int> refreshes;
    std::atomic<int> refreshed;
    std::atomic<int> running;
    std::atomic<int> wrong;
};

class TestCache : public Cache {
public:
    explicit TestCache(const std::string &name, bool flag = false)
        : Cache(kPath, name, kLifetime, flag, 3) {}
    Json::Value GetInfo() const override { return {}; }
    bool GetUpdatedData(Json::Value &value) const override { return refresh(value); }
    bool IsValid(const Json::Value &value) const override { return value.isString(); }
    bool IsNeedUpdate(const Json::Value &value) const override {
        return value.asString() == "outdated";
    }

    std::function<bool(Json::Value &)> refresh = [](Json::Value &value) {
        value = "fresh";
        return true;
    };
};

class CacheTest : public testing::Test {
protected:
    void SetUp() override {
        fakeNow = 1000000;
        setSystemClock([] { return fakeNow * 1000; });
    }
    void TearDown() override { setSystemClock(nullptr); }
    LogCapture log;
};

std::string text(const Json::Value &value) {
    return toString(value);
}

/// Runs `body` in `count` concurrent processes. \return how many exited with 0.
int inProcesses(int count, const std::function<void(int)> &body) {
    for (int i = 0; i < count; ++i) {
        if (fork() == 0) {
            body(i);
            _exit(0);
        }
    }
    int good = 0;
    int status = 0;
    while (wait(&status) > 0) {
        good += WIFEXITED(status) && WEXITSTATUS(status) == 0 ? 1 : 0;
    }
    return good;
}

Counters *sharedCounters() {
    void *memory =
        mmap(nullptr, sizeof(Counters), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    return new (memory) Counters{};
}

void sleepMs(int milliseconds) {
    std::this_thread::sleep_for(std::chrono::milliseconds(milliseconds));
}

} // namespace

TEST_F(CacheTest, NothingStoredReadsAsNullAndIsFetched) {
    TestCache cache("a");
    EXPECT_EQ(text(cache.GetCachedData()), "null");
    EXPECT_EQ(cache.GetCachedAge(), -1);
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
    EXPECT_EQ(text(cache.GetCachedData()), "\"fresh\"");
    struct stat status {};
    ASSERT_EQ(stat(kDir, &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0700U);
    ASSERT_EQ(stat(kPath, &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST_F(CacheTest, AValueIsFreshForItsLifetimeOnly) {
    TestCache cache("a");
    ASSERT_TRUE(cache.UpdateWithData("stored"));
    fakeNow += kLifetime;
    EXPECT_EQ(text(cache.Read()), "\"stored\"");
    EXPECT_EQ(cache.GetCachedAge(), kLifetime);
    fakeNow += 1;
    EXPECT_EQ(text(cache.GetCachedData()), "\"stored\"") << "however old";
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
}

TEST_F(CacheTest, AMeasurementIsAsOldAsItsEnd) {
    TestCache cache("a");
    ASSERT_TRUE(cache.UpdateWithData("slow probe", fakeNow - 12, fakeNow - 2));
    EXPECT_EQ(text(cache.Read()), "\"slow probe\"");
    EXPECT_EQ(cache.GetCachedAge(), 2);
}

TEST_F(CacheTest, AStampInTheFutureCountsAsExpired) {
    TestCache cache("a");
    cache.UpdateWithData("before the clock was set back");
    fakeNow -= 3600;
    EXPECT_EQ(cache.GetCachedAge(), -1);
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
}

TEST_F(CacheTest, AnUnusableValueIsRefreshedThoughFresh) {
    TestCache cache("a");
    cache.UpdateWithData(17);
    EXPECT_EQ(text(cache.GetCachedData()), "17");
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
    cache.UpdateWithData("outdated");
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
}

TEST_F(CacheTest, ARefreshThatYieldsNothingLeavesTheStoredValue) {
    TestCache cache("a");
    cache.refresh = [](Json::Value &value) {
        value = "half done";
        return false;
    };
    EXPECT_EQ(text(cache.Read()), "null");
    cache.UpdateWithData("stored");
    fakeNow += kLifetime + 1;
    EXPECT_EQ(text(cache.Read()), "\"stored\"");
    EXPECT_FALSE(cache.Update());
    EXPECT_EQ(text(cache.GetCachedData()), "\"stored\"");
}

TEST_F(CacheTest, UpdateFetchesWhateverIsStored) {
    TestCache cache("a");
    cache.UpdateWithData("stored");
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(text(cache.GetCachedData()), "\"fresh\"");
}

TEST_F(CacheTest, ARefreshMayReadAndWriteItsOwnEntry) {
    TestCache cache("a");
    cache.UpdateWithData("old");
    fakeNow += kLifetime + 1;
    cache.refresh = [](Json::Value &value) {
        TestCache inner("a");
        EXPECT_EQ(text(inner.Read()), "\"old\"") << "no refresh within the refresh";
        EXPECT_TRUE(inner.UpdateWithData("noted on the way"));
        value = "new";
        return true;
    };
    EXPECT_EQ(text(cache.Read()), "\"new\"");
}

TEST_F(CacheTest, RemoveTakesOneEntryAndMayFindNone) {
    TestCache("a").UpdateWithData("a");
    TestCache("b").UpdateWithData("b");
    EXPECT_TRUE(TestCache("a").Remove());
    EXPECT_TRUE(TestCache("a").Remove());
    EXPECT_EQ(text(TestCache("a").GetCachedData()), "null");
    EXPECT_EQ(text(TestCache("b").GetCachedData()), "\"b\"");
}

TEST_F(CacheTest, TheFileGrowsKeepsEverythingAndForgetsWhatIsLongPast) {
    constexpr int kEntries = 5000;
    const auto name = [](const char *kind, int i) { return kind + std::to_string(i); };
    for (int i = 0; i < kEntries; ++i) {
        ASSERT_TRUE(TestCache(name("old", i)).UpdateWithData(i));
    }
    for (int i = 0; i < kEntries; ++i) {
        ASSERT_EQ(text(TestCache(name("old", i)).GetCachedData()), std::to_string(i));
    }
    struct stat grown {};
    ASSERT_EQ(stat(kPath, &grown), 0);
    fakeNow += 8 * kDay;
    for (int i = 0; i < kEntries; ++i) {
        ASSERT_TRUE(TestCache(name("new", i)).UpdateWithData(i));
    }
    int left = 0;
    for (int i = 0; i < kEntries; ++i) {
        left += TestCache(name("old", i)).GetCachedData().isNull() ? 0 : 1;
        ASSERT_EQ(text(TestCache(name("new", i)).GetCachedData()), std::to_string(i));
    }
    EXPECT_EQ(left, 0);
    struct stat later {};
    ASSERT_EQ(stat(kPath, &later), 0);
    EXPECT_EQ(later.st_size, grown.st_size) << "the file does not grow for ever";
}

TEST_F(CacheTest, AValueTooLargeIsRefusedAndTheOldOneStays) {
    TestCache cache("a");
    ASSERT_TRUE(cache.UpdateWithData(std::string(3900, 'x')));
    EXPECT_FALSE(cache.UpdateWithData(std::string(5000, 'y')));
    EXPECT_EQ(cache.GetCachedData().asString(), std::string(3900, 'x'));
    EXPECT_EQ(log.count("too large"), 1);
    cache.refresh = [](Json::Value &value) {
        value = std::string(5000, 'z');
        return true;
    };
    fakeNow += kLifetime + 1;
    EXPECT_EQ(cache.Read().asString().size(), 5000U) << "who fetched it has it all the same";
}

TEST_F(CacheTest, LargeValuesThatShareABucketMakeRoomForOneAnother) {
    for (int i = 0; i < 64; ++i) {
        ASSERT_TRUE(TestCache("n" + std::to_string(i)).UpdateWithData(std::string(3000, 'x')));
        EXPECT_EQ(TestCache("n" + std::to_string(i)).GetCachedData().asString().size(), 3000U);
    }
    struct stat status {};
    stat(kPath, &status);
    EXPECT_LT(status.st_blocks * 512, 16 << 20);
}

TEST_F(CacheTest, DamageReadsAsAbsentAndIsMended) {
    std::mt19937 random(7);
    for (int round = 0; round < 60; ++round) {
        TestCache cache("a");
        ASSERT_TRUE(cache.UpdateWithData("good"));
        ASSERT_TRUE(cache.UpdateWithData("better"));
        {
            std::fstream file(kPath, std::ios::in | std::ios::out | std::ios::binary);
            file.seekg(0, std::ios::end);
            const auto size = static_cast<std::size_t>(file.tellg());
            if (round % 3 == 0) { // random data everywhere
                std::string rubbish(size, '\0');
                for (char &c : rubbish) {
                    c = static_cast<char>(random());
                }
                file.seekp(0);
                file << rubbish;
            } else { // some flipped bits
                for (int i = 0; i < 20000; ++i) {
                    file.seekp(static_cast<std::streamoff>(random() % size));
                    file.put(static_cast<char>(random()));
                }
            }
        }
        if (round % 3 == 2) {
            ASSERT_EQ(truncate(kPath, static_cast<off_t>(random() % 131072)), 0);
        }
        const std::string read = text(cache.GetCachedData());
        EXPECT_TRUE(read == "null" || read == "\"good\"" || read == "\"better\"") << read;
        ASSERT_TRUE(cache.UpdateWithData("mended"));
        EXPECT_EQ(text(cache.GetCachedData()), "\"mended\"");
        unlink(kPath);
    }
}

TEST_F(CacheTest, AWriteCutShortLeavesTheOldValue) {
    TestCache cache("a");
    cache.UpdateWithData("one");
    cache.UpdateWithData("two");
    // Corrupt the copy that holds "two", as a write killed halfway would.
    std::fstream file(kPath, std::ios::in | std::ios::out | std::ios::binary);
    std::string content((std::istreambuf_iterator<char>(file)), {});
    const std::size_t at = content.find("\"two\"");
    ASSERT_NE(at, std::string::npos);
    file.seekp(static_cast<std::streamoff>(at));
    file << "\"tw";
    file.put('\0');
    file.close();
    EXPECT_EQ(text(cache.GetCachedData()), "\"one\"");
    EXPECT_TRUE(cache.UpdateWithData("three"));
    EXPECT_EQ(text(cache.GetCachedData()), "\"three\"");
}

TEST_F(CacheTest, AStrangeFileUnderTheNameIsReplaced) {
    const std::vector<std::function<void()>> strange = {
        [] { EXPECT_EQ(symlink(kTarget, kPath), 0); },
        [] { EXPECT_EQ(mkfifo(kPath, 0600), 0); },
        [] {
            std::ofstream(kPath) << "x";
            EXPECT_EQ(chmod(kPath, 0666), 0);
        },
    };
    mkdir(kDir, 0700);
    for (const auto &make : strange) {
        unlink(kPath);
        make();
        TestCache cache("a");
        EXPECT_EQ(text(cache.GetCachedData()), "null");
        EXPECT_TRUE(cache.UpdateWithData("ours"));
        EXPECT_EQ(text(cache.GetCachedData()), "\"ours\"");
        EXPECT_NE(access(kTarget, F_OK), 0) << "nothing was made through a link";
    }
}

TEST_F(CacheTest, ADirectoryThatIsNotOursAloneIsRefusedOnceAndTheValueFetched) {
    ASSERT_EQ(mkdir(kDir, 0700), 0);
    ASSERT_EQ(chmod(kDir, 0777), 0);
    TestCache cache("a");
    EXPECT_FALSE(cache.UpdateWithData("x"));
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
    EXPECT_EQ(text(cache.GetCachedData()), "null");
    EXPECT_EQ(log.count("going on without a cache"), 1);
    ASSERT_EQ(rmdir(kDir), 0) << "nothing was written there";
    ASSERT_EQ(mkdir("/tmp/elsewhere", 0700), 0);
    ASSERT_EQ(symlink("/tmp/elsewhere", kDir), 0);
    EXPECT_FALSE(cache.UpdateWithData("x"));
    EXPECT_EQ(rmdir("/tmp/elsewhere"), 0);
}

TEST_F(CacheTest, ManyProcessesUpdateWithoutLosingAnEntry) {
    constexpr int kProcesses = 6;
    constexpr int kEach = 400;
    const int good = inProcesses(kProcesses, [](int process) {
        for (int i = 0; i < kEach; ++i) {
            const TestCache cache("p" + std::to_string(process) + "_" + std::to_string(i));
            if (!cache.UpdateWithData(i) || cache.GetCachedData() != Json::Value(i)) {
                _exit(1);
            }
        }
    });
    ASSERT_EQ(good, kProcesses);
    for (int process = 0; process < kProcesses; ++process) {
        for (int i = 0; i < kEach; ++i) {
            const TestCache cache("p" + std::to_string(process) + "_" + std::to_string(i));
            ASSERT_EQ(cache.GetCachedData(), Json::Value(i));
        }
    }
}

TEST_F(CacheTest, AReaderBesideWritersAlwaysSeesAWholeValue) {
    TestCache("a").UpdateWithData(std::string(3000, '0'));
    const int good = inProcesses(4, [](int process) {
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(700);
        const TestCache cache("a");
        for (int i = 0; std::chrono::steady_clock::now() < end; ++i) {
            if (process < 2) {
                cache.UpdateWithData(std::string(3000, static_cast<char>('0' + i % 10)));
                continue;
            }
            const Json::Value value = cache.GetCachedData();
            const std::string read = value.isString() ? value.asString() : "";
            if (read != std::string(3000, read.empty() ? 'x' : read[0])) {
                _exit(1);
            }
        }
    });
    EXPECT_EQ(good, 4);
}

TEST_F(CacheTest, ProcessesKilledAtAnyMomentLeaveEveryOtherEntryWhole) {
    for (int i = 0; i < 50; ++i) {
        TestCache("keep" + std::to_string(i)).UpdateWithData(i);
    }
    std::mt19937 random(11);
    for (int round = 0; round < 60; ++round) {
        const pid_t child = fork();
        if (child == 0) {
            for (int i = 0;; ++i) {
                TestCache("mine" + std::to_string(i % 500)).UpdateWithData(std::string(200, 'm'));
            }
        }
        std::this_thread::sleep_for(std::chrono::microseconds(500 + random() % 20000));
        kill(child, SIGKILL);
        waitpid(child, nullptr, 0);
        ASSERT_TRUE(TestCache("after").UpdateWithData(round)) << "no lock is left behind";
    }
    for (int i = 0; i < 50; ++i) {
        EXPECT_EQ(text(TestCache("keep" + std::to_string(i)).GetCachedData()), std::to_string(i));
    }
}

TEST_F(CacheTest, AnExpiredEntryIsRefreshedByOneProcessAndTheOthersTakeItsResult) {
    Counters *counters = sharedCounters();
    TestCache("a").UpdateWithData("old");
    fakeNow += kLifetime + 1;
    const int good = inProcesses(8, [&](int) {
        TestCache cache("a", true);
        cache.refresh = [&](Json::Value &value) {
            ++counters->refreshes;
            sleepMs(200);
            value = "new";
            return true;
        };
        _exit(text(cache.Read()) == "\"new\"" ? 0 : 1);
    });
    EXPECT_EQ(good, 8);
    EXPECT_EQ(counters->refreshes, 1);
}

TEST_F(CacheTest, WhoDoesNotNeedFreshDataTakesTheStoredValueAtOnce) {
    Counters *counters = sharedCounters();
    TestCache("a").UpdateWithData("old");
    fakeNow += kLifetime + 1;
    inProcesses(8, [&](int) {
        TestCache cache("a", false);
        cache.refresh = [&](Json::Value &value) {
            ++counters->refreshes;
            sleepMs(700);
            ++counters->refreshed;
            value = "new";
            return true;
        };
        const std::string read = text(cache.Read());
        counters->wrong += read == (counters->refreshed == 0 ? "\"old\"" : "\"new\"") ? 0 : 1;
    });
    EXPECT_EQ(counters->refreshes, 1);
    EXPECT_EQ(counters->wrong, 0);
}

TEST_F(CacheTest, ARefreshThatDiesIsTakenOver) {
    TestCache("a").UpdateWithData("old");
    fakeNow += kLifetime + 1;
    const pid_t child = fork();
    if (child == 0) {
        TestCache cache("a");
        cache.refresh = [](Json::Value &) -> bool {
            std::raise(SIGKILL);
            _exit(1);
        };
        cache.Read();
        _exit(1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    ASSERT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ(text(TestCache("a", true).Read()), "\"fresh\"");
}

TEST_F(CacheTest, ADamagedCopyWithARightChecksumStaysWithinItsBounds) {
    // Sizes that point outside the copy, with a valid checksum.
    BucketImage image(16, 3);
    ASSERT_TRUE(image.add({"name", "\"value\"", 1, 1, 1}));
    const std::string_view bytes = image.finish(1);
    std::array<std::byte, BucketImage::kSize> copy{};
    std::memcpy(copy.data(), bytes.data(), bytes.size());
    ASSERT_EQ(BucketImage::check(copy.data(), 16, 3), 1U);
    EXPECT_FALSE(BucketImage::check(copy.data(), 16, 4)) << "a copy of another bucket";
    EXPECT_FALSE(BucketImage::check(copy.data(), 32, 3)) << "a copy of a smaller file";
    for (std::size_t at = 32 + 24; at < 32 + 32; ++at) {
        auto bent = copy;
        bent[at] = std::byte{0xFF};
        EXPECT_FALSE(BucketImage::check(bent.data(), 16, 3));
        EXPECT_LE(BucketImage::entries(bent.data()).size(), 1U);
        BucketImage::find(bent.data(), "name");
    }
}
