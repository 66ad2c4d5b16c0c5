// SPDX-License-Identifier: Apache-2.0
#include "support/other_process.h"

#include <ovradrcore/file_lock.h>
#include <ovradrcore/util.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <functional>
#include <regex>
#include <set>
#include <utility>

using namespace OvraDRCore;

TEST(Util, UuidsAreVersionFourAndDiffer) {
    const std::regex form("[0-9a-f]{8}-[0-9a-f]{4}-4[0-9a-f]{3}-[89ab][0-9a-f]{3}-[0-9a-f]{12}");
    std::set<std::string> seen;
    for (int i = 0; i < 1000; ++i) {
        const std::string id = GenerateUUID();
        EXPECT_TRUE(std::regex_match(id, form)) << id;
        EXPECT_TRUE(seen.insert(id).second);
    }
}

TEST(Util, CreateDirMakesWhatIsMissingWithTheModeWhateverTheUmask) {
    umask(077);
    EXPECT_TRUE(File::CreateDir("/usr/ovra/a/b/", 0755));
    EXPECT_TRUE(File::CreateDir("/usr/ovra/a", 0700)) << "one that exists keeps its mode";
    for (const char *path : {"/usr/ovra/a", "/usr/ovra/a/b"}) {
        EXPECT_EQ(static_cast<int>(std::filesystem::status(path).permissions()), 0755) << path;
    }
    close(creat("/usr/ovra/file", 0600));
    EXPECT_FALSE(File::CreateDir("/usr/ovra/file/x", 0755));
    EXPECT_FALSE(File::CreateDir("/usr/ovra/file", 0755));
}

TEST(FileLock, IsOnePerNameForAllProcesses) {
    FileLock shared("a.lock");
    FileLock alsoShared("/run/lock/a.lock");
    EXPECT_TRUE(shared.lock(LOCK_SH | LOCK_NB, 0));
    EXPECT_TRUE(alsoShared.lock(LOCK_SH | LOCK_NB, 0));
    FileLock exclusive("a.lock");
    EXPECT_FALSE(exclusive.lock(LOCK_EX | LOCK_NB, 0));
    shared.unlock();
    alsoShared.unlock();
    EXPECT_TRUE(exclusive.lock(LOCK_EX | LOCK_NB, 0));
}

TEST(FileLock, GivesUpAfterTheWaitAndGoesWithItsProcessButNotWithAChildOfThat) {
    OvraTest::OtherProcess holder([] {
        FileLock held("b.lock");
        const bool ok = held.lock(LOCK_EX | LOCK_NB, 10);
        if (fork() == 0) { // it outlives its parent
            sleep(30);
            _exit(0);
        }
        return ok ? pause() : 1;
    });
    FileLock lock("b.lock");
    while (lock.lock(LOCK_SH | LOCK_NB, 0)) {
        lock.unlock();
        usleep(1000);
    }
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(lock.lock(LOCK_SH | LOCK_NB, 1));
    const std::chrono::duration<double> waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited.count(), 1.0);
    EXPECT_LT(waited.count(), 5.0);
    usleep(100'000);
    holder.end(SIGKILL);
    EXPECT_TRUE(lock.lock(LOCK_SH | LOCK_NB, 0));
}

TEST(FileLock, IsHadAgainstSomebodyWhoPutsThingsInItsPlaceAllTheTime) {
    const std::string path = "/run/lock/e.lock";
    chmod("/run/lock", 01777);
    OvraTest::OtherProcess attacker([&] {
        if (geteuid() != 0 || setgid(65534) != 0 || setuid(65534) != 0) {
            return 1; // an ordinary user has no other one
        }
        for (unsigned int i = 0;; ++i) {
            i % 2 == 0 ? mkdir(path.c_str(), 0777) : mknod(path.c_str(), 0666, 0);
        }
    });
    for (int i = 0; i < 300; ++i) {
        EXPECT_TRUE(FileLock("e.lock").lock(LOCK_EX | LOCK_NB, 1)) << i;
        unlink(path.c_str());
    }
}

TEST(FileLock, ReplacesWhateverSomebodyElsePutInItsPlace) {
    const std::string path = "/run/lock/c.lock";
    const std::pair<const char *, std::function<bool()>> planted[] = {
        {"link", [&] { return symlink("/usr/ovra/target", path.c_str()) == 0; }},
        {"FIFO", [&] { return mkfifo(path.c_str(), 0600) == 0; }},
        {"folder", [&] { return File::CreateDir(path + "/x", 0755); }},
        {"open to all",
         [&] { return mknod(path.c_str(), 0600, 0) == 0 && !chmod(path.c_str(), 0644); }},
        {"second name",
         [&] { return mknod("/run/lock/d", 0600, 0) == 0 && !link("/run/lock/d", path.c_str()); }},
        // Only the superuser can make it.
        {"other owner",
         [&] {
             return mknod(path.c_str(), 0600, 0) == 0 &&
                    (chown(path.c_str(), 65534, 0) == 0 || errno == EINVAL);
         }},
        {"folder is missing", [] { return std::filesystem::remove_all("/run/lock") > 0; }},
    };
    for (const auto &[what, plant] : planted) {
        ASSERT_TRUE(plant()) << what;
        const int theirs = open(path.c_str(), O_RDONLY | O_NONBLOCK);
        flock(theirs, LOCK_EX | LOCK_NB);
        FileLock lock("c.lock");
        EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0)) << what;
        EXPECT_FALSE(FileLock("c.lock").lock(LOCK_EX | LOCK_NB, 0)) << what;
        close(theirs);
        unlink(path.c_str());
    }
    EXPECT_NE(access("/usr/ovra/target", F_OK), 0) << "nothing was made through the link";
}
