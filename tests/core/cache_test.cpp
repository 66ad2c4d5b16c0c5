// SPDX-License-Identifier: Apache-2.0
#include "cache_bucket.h"
#include "clock.h"
#include "support/log_capture.h"
#include "support/print_json.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/json.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <xxhash.h>

#include <atomic>
#include <cerrno>
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
};

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

/// Runs `body` in `count` concurrent processes, and `meanwhile` in this one. \return how many
/// exited with 0.
int inProcesses(
    int count, const std::function<void(int)> &body,
    const std::function<void()> &meanwhile = [] {}) {
    for (int i = 0; i < count; ++i) {
        if (fork() == 0) {
            body(i);
            _exit(0);
        }
    }
    meanwhile();
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

/// Makes every lock of an open file description fail in this process, as on some file systems.
void breakRefreshLocks() {
    sock_filter filter[] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_fcntl, 0, 3),
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, args[1])),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, F_OFD_SETLK, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | ENOLCK),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
    };
    const sock_fprog program = {std::size(filter), filter};
    if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
        prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0) {
        _exit(2);
    }
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
    cache.refresh = [&](Json::Value &) { return cache.UpdateWithData("on the way") && false; };
    EXPECT_EQ(text(cache.Read()), "\"on the way\"");
}

TEST_F(CacheTest, ARefreshedValueIsAsOldAsTheFindingBehindIt) {
    const struct {
        long took;
        bool otherMeanwhile; // another process stores a second before the end
        const char *read;
        long age;
    } cases[] = {
        {10, false, "\"found\"", 0},
        {10, true, "\"found\"", 0},
        {120, false, "\"found\"", 120 - Cache::kLongestRefresh}, // the process was stopped
        {120, true, "\"other\"", 1},
    };
    for (const auto &each : cases) {
        TestCache cache("a");
        cache.Remove();
        cache.refresh = [&](Json::Value &value) {
            fakeNow += each.took - 1;
            EXPECT_TRUE(!each.otherMeanwhile || TestCache("a").UpdateWithData("other"));
            fakeNow += 1;
            value = "found";
            return true;
        };
        EXPECT_EQ(text(cache.Read()), each.read) << each.took;
        EXPECT_EQ(cache.GetCachedAge(), each.age) << each.took << each.otherMeanwhile;
    }
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
    mkdir(kDir, 0700);
    std::ofstream((std::string(kPath) + ".new").c_str()) << "left behind by a process that died";
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
            EXPECT_EQ(text(cache.Read()), "\"fresh\"");
            EXPECT_EQ(text(cache.GetCachedData()), "\"fresh\"");
            struct stat status {};
            EXPECT_EQ(lstat(path.c_str(), &status), 0);
            EXPECT_EQ(status.st_mode, S_IFREG | 0600U);
            EXPECT_NE(access(kTarget, F_OK), 0) << "nothing was made through a link";
        }
    }
}

TEST_F(CacheTest, ADirectoryThatIsNotOursAloneIsRefusedOnceAndTheValueFetched) {
    ASSERT_EQ(mkdir(kDir, 0700), 0);
    ASSERT_EQ(chmod(kDir, 0777), 0);
    TestCache cache("a");
    EXPECT_FALSE(cache.UpdateWithData("x"));
    EXPECT_FALSE(cache.Update());
    EXPECT_EQ(text(cache.Read()), "\"fresh\"");
    EXPECT_EQ(text(cache.GetCachedData()), "null");
    EXPECT_EQ(text(TestCache("a", true, "/proc/none/c").Read()), "\"fresh\"");
    EXPECT_EQ(log.count("going on without a cache"), 1);
    EXPECT_EQ(log.lines().size(), 1U);
    ASSERT_EQ(rmdir(kDir), 0) << "nothing was written there";
    ASSERT_EQ(mkdir("/tmp/elsewhere", 0700), 0);
    ASSERT_EQ(symlink("/tmp/elsewhere", kDir), 0);
    EXPECT_FALSE(cache.UpdateWithData("x"));
    EXPECT_EQ(rmdir("/tmp/elsewhere"), 0);
}

TEST_F(CacheTest, WritersThatAreKilledBesideOthersLoseAndTearNothing) {
    constexpr int kProcesses = 4;
    constexpr int kEach = 400;
    const auto name = [](int process, int i) {
        return "p" + std::to_string(process) + "_" + std::to_string(i);
    };
    std::mt19937 random(11);
    const int good = inProcesses(
        kProcesses,
        [&](int process) {
            const TestCache shared("shared");
            for (int i = 0; i < kEach; ++i) {
                const TestCache cache(name(process, i));
                bool whole =
                    cache.UpdateWithData(i) && cache.GetCachedData() == Json::Value(i) &&
                    shared.UpdateWithData(std::string(3000, static_cast<char>('0' + i % 10)));
                const Json::Value value = shared.GetCachedData();
                whole = whole && value.isString() && value.asString().size() == 3000 &&
                        value.asString() == std::string(3000, value.asString()[0]);
                if (!whole) {
                    _exit(1);
                }
            }
        },
        [&] {
            for (int round = 0; round < 60; ++round) {
                const pid_t victim = fork();
                if (victim == 0) {
                    for (int i = 0;; ++i) {
                        TestCache(name(99, i % 500)).UpdateWithData(std::string(200, 'm'));
                    }
                }
                std::this_thread::sleep_for(std::chrono::microseconds(500 + random() % 20000));
                kill(victim, SIGKILL);
                waitpid(victim, nullptr, 0);
                ASSERT_TRUE(TestCache("after").UpdateWithData(round)) << "no lock is left behind";
            }
        });
    ASSERT_EQ(good, kProcesses);
    for (int i = 0; i < kProcesses * kEach; ++i) {
        ASSERT_EQ(TestCache(name(i / kEach, i % kEach)).GetCachedData(), Json::Value(i % kEach));
    }
}

TEST_F(CacheTest, OfManyReadersOneRefreshesAndTheOthersShareItsResultOrItsFailure) {
    for (const bool success : {true, false}) {
        Counters *counters = sharedCounters();
        TestCache("a").UpdateWithData("old");
        fakeNow += kLifetime + 1;
        const int good = inProcesses(8, [&](int) {
            TestCache cache("a", true);
            cache.refresh = [&](Json::Value &value) {
                ++counters->refreshes;
                sleepMs(500);
                value = "new";
                return success;
            };
            _exit(text(cache.Read()) == (success ? "\"new\"" : "\"old\"") ? 0 : 1);
        });
        EXPECT_EQ(good, 8);
        EXPECT_GE(counters->refreshes, 1);
        EXPECT_LE(counters->refreshes, success ? 1 : 3) << "those that came late had missed it";
    }
}

TEST_F(CacheTest, ARefreshThatHangsHoldsOthersUpOnceAndNotForLong) {
    constexpr const char *kOther = "/tmp/.ovradrcache//d";
    TestCache("a").UpdateWithData("old");
    TestCache("b", false, kOther).UpdateWithData("old");
    fakeNow += kLifetime + Cache::kLongestRefresh;
    int ready[2];
    ASSERT_EQ(pipe(ready), 0);
    const pid_t hung = fork();
    if (hung == 0) {
        TestCache outer("a");
        TestCache inner("b", false, kOther);
        outer.refresh = [&](Json::Value &) { return inner.Read().isNull(); };
        inner.refresh = [&](Json::Value &) { return write(ready[1], "x", 1) == 1 && pause() == 0; };
        outer.Read();
        _exit(1);
    }
    char byte = 0;
    ASSERT_EQ(read(ready[0], &byte, 1), 1);
    EXPECT_EQ(text(TestCache("a").Read()), "\"old\"") << "at once: it has not expired long ago";
    EXPECT_EQ(text(TestCache("c", true).Read()), "\"fresh\"") << "every entry has its own lock";
    EXPECT_EQ(log.count("Waited too long"), 0);
    fakeNow += 1;
    for (const bool again : {false, true}) {
        const CacheWaitScope request;
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(text(TestCache("a", again).Read()), "\"fresh\"");
        EXPECT_EQ(text(TestCache("b", again, kOther).Read()), "\"fresh\"");
        const std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
        EXPECT_GE(took.count(), again ? 0 : Cache::kLongestRefresh - 1);
        EXPECT_LT(took.count(),
                  again ? Cache::kLongestRefresh - 2 : 2 * Cache::kLongestRefresh - 2);
        fakeNow += kLifetime + 1;
    }
    EXPECT_EQ(log.count("Waited too long"), 2);
    kill(hung, SIGKILL);
    waitpid(hung, nullptr, 0);
}

TEST_F(CacheTest, ARefreshThatDiesIsTakenOverAtOnceThoughItsChildrenLive) {
    TestCache("a").UpdateWithData("old");
    fakeNow += kLifetime + 1;
    const int good = inProcesses(1, [](int) {
        TestCache cache("a");
        cache.refresh = [](Json::Value &) -> bool {
            for (const bool exec : {true, false}) {
                if (fork() == 0) {
                    alarm(60);
                    exec ? execlp("sleep", "sleep", "60", nullptr) : pause();
                    _exit(0);
                }
            }
            std::raise(SIGKILL);
            _exit(0);
        };
        cache.Read();
    });
    ASSERT_EQ(good, 0);
    EXPECT_EQ(text(TestCache("a", true).Read()), "\"fresh\"");
    EXPECT_EQ(log.count("Waited too long"), 0);
}

TEST_F(CacheTest, WhereLocksFailEveryReaderRefreshes) {
    const int good = inProcesses(1, [&](int) {
        breakRefreshLocks();
        for (const char *name : {"a", "b"}) {
            const bool fresh = text(TestCache(name, true).Read()) == "\"fresh\"";
            if (!fresh || TestCache(name).GetCachedData().isNull()) {
                _exit(1);
            }
        }
        _exit(log.lines().size() == 1 && log.count("No locks available") == 1 ? 0 : 1);
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
