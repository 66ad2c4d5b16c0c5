// SPDX-License-Identifier: Apache-2.0
#include "cache_bucket.h"
#include "clock.h"
#include "support/log_capture.h"
#include "support/other_process.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/json.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <xxhash.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <list>
#include <random>
#include <thread>

using namespace OvraDRCore;
using namespace std::chrono_literals;

namespace {

constexpr const char *kDir = "/tmp/.ovradrcache";
constexpr const char *kPath = "/tmp/.ovradrcache//c";
constexpr const char *kTarget = "/tmp/.ovradrcache/target";
constexpr const char *kFresh = "\"fresh\"";
constexpr long kLifetime = 5;
constexpr std::int64_t kDay = 86400;

std::int64_t fakeNow = 0;

class TestCache : public Cache {
public:
    explicit TestCache(const std::string &name, bool flag = false, const char *path = kPath)
        : Cache(path, name, kLifetime, flag, 3) {}
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

mode_t modeOf(const std::string &path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode : 0;
}

/// Runs `body` in `count` concurrent processes, and `meanwhile` in this one. \return how many
/// exited with 0.
int inProcesses(
    int count, const std::function<void(int)> &body,
    const std::function<void()> &meanwhile = [] {}) {
    std::list<OvraTest::OtherProcess> processes;
    for (int i = 0; i < count; ++i) {
        processes.emplace_back([&] {
            body(i);
            return 0;
        });
    }
    meanwhile();
    int good = 0;
    for (OvraTest::OtherProcess &each : processes) {
        good += each.wait() == 0 ? 1 : 0;
    }
    return good;
}

} // namespace

TEST_F(CacheTest, NothingStoredOrRemovedReadsAsNullAndIsFetched) {
    TestCache cache("a");
    EXPECT_EQ(text(cache.GetCachedData()), "null");
    EXPECT_EQ(cache.GetCachedAge(), -1);
    TestCache failing("a");
    failing.refresh = [](Json::Value &value) {
        value = "half done";
        return false;
    };
    EXPECT_FALSE(failing.Update());
    EXPECT_EQ(text(failing.Read()), "null");
    EXPECT_EQ(text(cache.Read()), kFresh);
    EXPECT_EQ(text(cache.GetCachedData()), kFresh);
    EXPECT_EQ(modeOf(kDir), S_IFDIR | 0700U);
    EXPECT_EQ(modeOf(kPath), S_IFREG | 0600U);
    TestCache("b").UpdateWithData("b");
    EXPECT_TRUE(cache.Remove() && cache.Remove());
    EXPECT_EQ(text(cache.GetCachedData()) + text(TestCache("b").GetCachedData()), "null\"b\"");
}

TEST_F(CacheTest, AStoredValueIsReadWhileItIsFreshAndUsable) {
    const std::tuple<Json::Value, long, double, bool> cases[] = {
        // value, later, age, read
        {"stored", kLifetime, kLifetime, true},
        {"stored", kLifetime + 1, kLifetime + 1, false},
        {"clock set back", -3600, -1, false},
        {17, 0, 0, false},
        {"outdated", 0, 0, false},
    };
    for (const auto &[value, later, age, read] : cases) {
        TestCache cache("a");
        ASSERT_TRUE(cache.UpdateWithData(value));
        fakeNow += later;
        EXPECT_EQ(text(cache.GetCachedData()), text(value)) << "however old";
        EXPECT_EQ(cache.GetCachedAge(), age) << value;
        EXPECT_EQ(text(cache.Read()), read ? text(value) : kFresh) << later;
        cache.UpdateWithData(value);
        EXPECT_TRUE(cache.Update());
        EXPECT_EQ(text(cache.GetCachedData()), kFresh) << "whatever is stored";
    }
    ASSERT_TRUE(TestCache("a").UpdateWithData("slow probe", fakeNow - 12, fakeNow - 2));
    EXPECT_EQ(text(TestCache("a").Read()), "\"slow probe\"");
    EXPECT_EQ(TestCache("a").GetCachedAge(), 2) << "as old as its end";
}

TEST_F(CacheTest, AListingSeesTheFileAsItWasAndEveryEntryOfIt) {
    constexpr int kMany = 500; // so that the file grows
    for (int i = 0; i < kMany; ++i) {
        ASSERT_TRUE(TestCache(std::to_string(i)).UpdateWithData(std::to_string(i)));
    }
    {
        const CacheSnapshotScope scope;
        for (int i = 0; i < kMany; ++i) {
            EXPECT_EQ(TestCache(std::to_string(i)).GetCachedData(), std::to_string(i));
        }
        EXPECT_EQ(text(TestCache("none").GetCachedData()), "null");
        const CacheSnapshotScope inner;
        ASSERT_TRUE(TestCache("0").UpdateWithData("new"));
        EXPECT_EQ(TestCache("0").GetCachedData(), "0");
        EXPECT_EQ(TestCache("0").Read(), "new") << "what decides is read as ever";
    }
    EXPECT_EQ(TestCache("0").GetCachedData(), "new");
}

TEST_F(CacheTest, ARefreshMayReadAndWriteItsOwnEntry) {
    for (const bool success : {true, false}) {
        TestCache cache("a");
        cache.UpdateWithData("old");
        fakeNow += kLifetime + 1;
        cache.refresh = [=](Json::Value &value) {
            TestCache inner("a");
            EXPECT_EQ(text(inner.Read()), "\"old\"") << "no refresh within the refresh";
            EXPECT_TRUE(inner.UpdateWithData("noted on the way"));
            value = "new";
            return success;
        };
        EXPECT_EQ(text(cache.Read()), success ? "\"new\"" : "\"noted on the way\"");
    }
}

TEST_F(CacheTest, ARefreshedValueIsAsOldAsTheFindingBehindIt) {
    const std::tuple<long, bool, const char *, long> cases[] = {
        {10, false, "\"found\"", 0},
        {10, true, "\"found\"", 0},
        {120, false, "\"found\"", 120 - Cache::kLongestRefresh}, // the process was stopped
        {120, true, "\"other\"", 1},
    };
    for (const auto &[took, otherMeanwhile, read, age] : cases) {
        TestCache cache("a");
        cache.Remove();
        cache.refresh = [lasts = took, other = otherMeanwhile](Json::Value &value) {
            fakeNow += lasts - 1;
            EXPECT_TRUE(!other || TestCache("a").UpdateWithData("other"));
            fakeNow += 1;
            value = "found";
            return true;
        };
        EXPECT_EQ(text(cache.Read()), read) << took;
        EXPECT_EQ(cache.GetCachedAge(), age) << took << otherMeanwhile;
    }
}

TEST_F(CacheTest, TheFileGrowsKeepsEverythingAndForgetsWhatIsLongPast) {
    constexpr int kEntries = 5000;
    mkdir(kDir, 0700);
    std::ofstream(std::string(kPath) + ".new") << "left behind by a process that died";
    struct stat grown {};
    for (const std::string kind : {"old", "new"}) {
        for (int i = 0; i < kEntries; ++i) {
            ASSERT_TRUE(TestCache(kind + std::to_string(i)).UpdateWithData(i));
        }
        for (int i = 0; i < kEntries; ++i) {
            ASSERT_EQ(TestCache(kind + std::to_string(i)).GetCachedData(), Json::Value(i));
            ASSERT_EQ(TestCache("old" + std::to_string(i)).GetCachedData().isNull(), kind == "new");
        }
        const off_t size = grown.st_size;
        ASSERT_EQ(stat(kPath, &grown), 0);
        EXPECT_TRUE(size == 0 || size == grown.st_size) << "the file does not grow for ever";
        fakeNow += 8 * kDay;
    }
}

TEST_F(CacheTest, LargeValuesAreStoredUpToABucketAndEvictTheOldest) {
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
    for (int i = 0; i < 64; ++i) { // those that share a bucket make room for one another
        ASSERT_TRUE(TestCache("n" + std::to_string(i)).UpdateWithData(std::string(3000, 'x')));
        EXPECT_EQ(TestCache("n" + std::to_string(i)).GetCachedData().asString().size(), 3000U);
    }
    EXPECT_LE(std::filesystem::file_size(kPath), 16U << 20U);
}

TEST_F(CacheTest, DamageReadsAsAbsentAndIsMended) {
    std::mt19937 random(7);
    for (int round = 0; round < 60; ++round) {
        TestCache cache("a");
        ASSERT_TRUE(cache.UpdateWithData("good"));
        ASSERT_TRUE(cache.UpdateWithData("better"));
        const auto size = static_cast<std::size_t>(std::filesystem::file_size(kPath));
        std::fstream file(kPath, std::ios::in | std::ios::out | std::ios::binary);
        // All of it, or some bytes.
        for (std::size_t i = 0; i < (round % 3 == 0 ? size : 20000); ++i) {
            file.seekp(static_cast<std::streamoff>(round % 3 == 0 ? i : random() % size));
            file.put(static_cast<char>(random()));
        }
        file.close();
        if (round % 3 == 2) {
            std::filesystem::resize_file(kPath, random() % size);
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
    std::fstream file(kPath, std::ios::in | std::ios::out | std::ios::binary);
    const std::string content((std::istreambuf_iterator<char>(file)), {});
    file.seekp(static_cast<std::streamoff>(content.find("\"two\"")) + 3);
    file.put('\0');
    file.close();
    EXPECT_EQ(text(cache.GetCachedData()), "\"one\"");
    EXPECT_TRUE(cache.UpdateWithData("three"));
    EXPECT_EQ(text(cache.GetCachedData()), "\"three\"");
}

TEST_F(CacheTest, WhateverElseHasTheNameOfTheFileOrItsLockIsReplaced) {
    const std::function<void(const char *)> strange[] = {
        [](const char *path) { EXPECT_EQ(symlink(kTarget, path), 0); },
        [](const char *path) { EXPECT_EQ(mkfifo(path, 0600), 0); },
        [](const char *path) {
            std::ofstream(path) << "x";
            EXPECT_EQ(chmod(path, 0666), 0);
        },
        [](const char *path) {
            EXPECT_EQ(mkdir(path, 0700), 0);
            std::ofstream(std::string(path) + "/x") << "x";
        },
    };
    mkdir(kDir, 0700);
    for (const auto &make : strange) {
        for (const std::string path : {kPath, "/tmp/.ovradrcache//c.lock"}) {
            unlink(kPath);
            unlink(path.c_str());
            make(path.c_str());
            TestCache cache("a");
            EXPECT_EQ(text(cache.GetCachedData()), "null");
            EXPECT_EQ(text(cache.Read()), kFresh);
            EXPECT_EQ(text(cache.GetCachedData()), kFresh);
            EXPECT_EQ(modeOf(path), S_IFREG | 0600U);
            EXPECT_NE(access(kTarget, F_OK), 0) << "nothing was made through a link";
        }
    }
}

TEST_F(CacheTest, ADirectoryThatIsNotOursAloneIsMovedAwayAndWithoutOneTheValueIsFetched) {
    ASSERT_EQ(mkdir("/tmp/elsewhere", 0700), 0);
    const std::function<int()> planted[] = {
        [] { return mkdir(kDir, 0700) + chmod(kDir, 0777); },
        [] { return symlink("/tmp/elsewhere", kDir); },
        [] { return mkfifo(kDir, 0600); },
    };
    for (const auto &plant : planted) {
        std::filesystem::remove_all(kDir);
        ASSERT_EQ(plant(), 0);
        EXPECT_TRUE(TestCache("a").UpdateWithData("x"));
        EXPECT_EQ(text(TestCache("a").GetCachedData()), "\"x\"");
        EXPECT_EQ(modeOf(kDir), S_IFDIR | 0700U);
    }
    EXPECT_EQ(rmdir("/tmp/elsewhere"), 0) << "nothing was written there";
    const TestCache without("a", true, "/proc/none/c");
    EXPECT_FALSE(without.UpdateWithData("x"));
    EXPECT_EQ(text(without.Read()), kFresh);
    EXPECT_EQ(log.count("going on without a cache"), 1);
}

TEST_F(CacheTest, OfManyReadersOneRefreshesAndTheOthersShareItsResultOrItsFailure) {
    for (const bool success : {false, true}) { // an earlier failure counts for nothing
        const std::string refreshes = success ? "/tmp/successes" : "/tmp/failures";
        TestCache("a").UpdateWithData("old");
        fakeNow += kLifetime + 1;
        const int good = inProcesses(8, [&](int) {
            TestCache cache("a", true);
            cache.refresh = [&](Json::Value &value) {
                std::ofstream(refreshes, std::ios::app) << 'x';
                std::this_thread::sleep_for(500ms);
                value = "new";
                return success;
            };
            _exit(text(cache.Read()) == (success ? "\"new\"" : "\"old\"") ? 0 : 1);
        });
        EXPECT_EQ(good, 8);
        EXPECT_LE(std::filesystem::file_size(refreshes), success ? 1U : 3U) << "some may come late";
    }
}

TEST_F(CacheTest, ARefreshThatHangsHoldsOthersUpOnceAndNotForLong) {
    const char *const other = "/tmp/.ovradrcache//d";
    TestCache outer("a");
    TestCache inner("b", false, other);
    outer.UpdateWithData("old");
    inner.UpdateWithData("old");
    fakeNow += kLifetime + Cache::kLongestRefresh;
    std::promise<void> begun;
    std::promise<void> released;
    outer.refresh = [&](Json::Value &) { return inner.Read().isNull(); };
    inner.refresh = [&](Json::Value &) {
        begun.set_value();
        released.get_future().wait();
        return false;
    };
    const auto hung = std::async(std::launch::async, [&] { outer.Read(); });
    begun.get_future().wait();
    EXPECT_EQ(text(TestCache("a").Read()), "\"old\"") << "at once: it has not expired long ago";
    EXPECT_EQ(text(TestCache("c", true).Read()), kFresh) << "every entry has its own lock";
    EXPECT_EQ(log.count("Waited too long"), 0);
    fakeNow += 1;
    for (const bool again : {false, true}) {
        const CacheWaitScope request;
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(text(TestCache("a", again).Read()), kFresh);
        EXPECT_EQ(text(TestCache("b", again, other).Read()), kFresh);
        const std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
        EXPECT_LT(took.count(), again ? 9 : 20);
        fakeNow += kLifetime + 1;
    }
    EXPECT_EQ(log.count("Waited too long"), 2);
    released.set_value();
}

TEST_F(CacheTest, AWriterThatHangsHoldsOthersUpOnce) {
    TestCache("a").UpdateWithData("old");
    OvraTest::OtherProcess stopped([] {
        const int fd = open(kPath, O_RDWR);
        return flock(fd, LOCK_EX) == 0 && std::raise(SIGSTOP) == 0 ? 0 : 1;
    });
    waitpid(stopped.pid(), nullptr, WUNTRACED);
    EXPECT_EQ(text(TestCache("a").Read()), "\"old\"") << "readers need no lock";
    auto another =
        std::async(std::launch::async, [] { return TestCache("c").UpdateWithData("c"); });
    EXPECT_TRUE(TestCache("a").UpdateWithData("new"));
    EXPECT_TRUE(another.get()) << "whoever of the two replaced it, the other uses the new one";
    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(TestCache("b").UpdateWithData("next"));
    EXPECT_LT(std::chrono::steady_clock::now() - start, 1500ms);
    EXPECT_EQ(text(TestCache("a").GetCachedData()), "\"new\"");
    EXPECT_EQ(text(TestCache("c").GetCachedData()), "\"c\"");
    stopped.end(SIGCONT);
    EXPECT_EQ(text(TestCache("b").GetCachedData()), "\"next\"");
}

TEST_F(CacheTest, ARefreshThatDiesIsTakenOverAtOnceThoughItsChildrenLive) {
    TestCache("a").UpdateWithData("old");
    fakeNow += kLifetime + 1;
    const int good = inProcesses(1, [](int) {
        TestCache cache("a");
        cache.refresh = [](Json::Value &) -> bool {
            std::string sleep = "sleep";
            std::string seconds = "60";
            char *const words[] = {sleep.data(), seconds.data(), nullptr};
            if (posix_spawnp(nullptr, "sleep", nullptr, nullptr, words, nullptr) == 0 &&
                fork() == 0) {
                alarm(60);
                pause();
            }
            std::raise(SIGKILL);
            _exit(0);
        };
        cache.Read();
    });
    ASSERT_EQ(good, 0);
    EXPECT_EQ(text(TestCache("a", true).Read()), kFresh);
    EXPECT_EQ(log.count("Waited too long"), 0);
}

TEST_F(CacheTest, WhereLocksFailEveryReaderRefreshes) {
    const int good = inProcesses(1, [&](int) {
        sock_filter filter[] = {
            BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
            BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_fcntl, 0, 1),
            BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | ENOLCK),
            BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
        };
        const sock_fprog program = {std::size(filter), filter};
        const bool broken = prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
                            prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
        const std::string read = text(TestCache("a", true).Read()) + text(TestCache("b").Read());
        _exit(broken && read == std::string(kFresh) + kFresh && log.lines().size() == 1 &&
                      log.count("No locks available") == 1
                  ? 0
                  : 1);
    });
    EXPECT_EQ(good, 1);
}

TEST_F(CacheTest, ADamagedCopyWithARightChecksumStaysWithinItsBounds) {
    BucketImage image(16, 3);
    ASSERT_TRUE(image.add({"name", "\"value\"", 1, 1, 1}));
    const std::string_view bytes = image.finish(1);
    std::array<std::byte, BucketImage::kSize> copy{};
    std::memcpy(copy.data(), bytes.data(), bytes.size());
    ASSERT_EQ(BucketImage::check(copy.data(), 16, 3), 1U);
    EXPECT_FALSE(BucketImage::check(copy.data(), 16, 4)) << "a copy of another bucket";
    EXPECT_FALSE(BucketImage::check(copy.data(), 32, 3)) << "a copy of a smaller file";
    for (std::size_t at = 32 + 24; at < 32 + 32; ++at) { // the sizes of name and value
        auto bent = copy;
        bent[at] = std::byte{0xFF};
        EXPECT_FALSE(BucketImage::check(bent.data(), 16, 3));
        const std::uint64_t sum = XXH3_64bits(bent.data() + 8, bytes.size() - 8);
        std::memcpy(bent.data(), &sum, sizeof(sum));
        ASSERT_EQ(BucketImage::check(bent.data(), 16, 3), 1U);
        EXPECT_EQ(BucketImage::entries(bent.data()).size(), 0U);
        EXPECT_FALSE(BucketImage::find(bent.data(), "name"));
    }
}

TEST_F(CacheTest, AForgedBucketWithExtremeNumbersIsReadAndReplaced) {
    for (const std::uint64_t sequence : {std::uint64_t{1}, UINT64_MAX - 2, UINT64_MAX - 1}) {
        TestCache cache("a");
        ASSERT_TRUE(cache.UpdateWithData("makes the file"));
        const auto index = static_cast<std::uint32_t>(cacheNameHash("a")) & 15U;
        BucketImage image(16, index);
        ASSERT_TRUE(image.add({"a", "\"forged\"", 0, INT64_MIN, INT64_MIN}));
        const std::string_view forged = image.finish(sequence);
        std::fstream file(kPath, std::ios::in | std::ios::out | std::ios::binary);
        for (const std::size_t copy : {0U, 1U}) {
            file.seekp(static_cast<std::streamoff>((2 * index + copy) * BucketImage::kSize));
            file.write(forged.data(), static_cast<std::streamsize>(forged.size()));
        }
        file.close();
        EXPECT_EQ(text(cache.GetCachedData()), "\"forged\"");
        EXPECT_GT(cache.GetCachedAge(), 9e15) << "as old as can be";
        for (const char *value : {"one", "two", "three"}) {
            ASSERT_TRUE(cache.UpdateWithData(value));
            EXPECT_EQ(text(cache.GetCachedData()), '"' + std::string(value) + '"') << sequence;
        }
    }
    EXPECT_TRUE(isLongPast(0, INT64_MIN, 1)) << "no lifetime is that short";
    EXPECT_FALSE(isLongPast(INT64_MIN, INT64_MAX, INT64_MIN / 2));
}
