// SPDX-License-Identifier: Apache-2.0
#include "support/other_process.h"

#include <ovrabase/lock.h>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>

#include <cerrno>

using namespace OvraBase;
using namespace std::chrono_literals;

namespace {

constexpr char kPath[] = "/tmp/lock_test.lock";

UniqueFd openLock() {
    return UniqueFd(open(kPath, O_RDWR | O_CREAT | O_CLOEXEC, 0600));
}

} // namespace

TEST(Lock, ExcludesAnotherOpenFileUntilItGoes) {
    auto held = LockedFd::lock(openLock(), LOCK_EX, 0ms);
    ASSERT_TRUE(held);
    const auto begun = std::chrono::steady_clock::now();
    EXPECT_EQ(LockedFd::lock(openLock(), LOCK_EX, 100ms).error().number, ETIMEDOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - begun, 100ms);
    held->reset();
    EXPECT_TRUE(LockedFd::lock(openLock(), LOCK_EX, 0ms));
}

TEST(Lock, IsNotLeftWithAChildThatWasForkedMeanwhile) {
    auto held = LockedFd::lock(openLock(), LOCK_EX, 0ms);
    const UniqueFd byte = openLock();
    ASSERT_TRUE(held);
    ASSERT_TRUE(lockByte(byte.get(), 7, 0ms));
    EXPECT_TRUE(lockByte(openLock().get(), 8, 0ms)) << "another byte";
    EXPECT_EQ(lockByte(openLock().get(), 7, 0ms).error().number, ETIMEDOUT);
    const OvraTest::OtherProcess child(pause); // keeps the open files of this one
    held->reset();
    unlockByte(byte.get(), 7);
    EXPECT_TRUE(LockedFd::lock(openLock(), LOCK_EX, 0ms));
    EXPECT_TRUE(lockByte(openLock().get(), 7, 0ms));
}

TEST(Lock, SaysAtOnceWhyItCannotBeHad) {
    const auto begun = std::chrono::steady_clock::now();
    EXPECT_EQ(lockFile(-1, LOCK_EX, 10s).error().number, EBADF);
    const UniqueFd readOnly(open("/dev/null", O_RDONLY | O_CLOEXEC));
    EXPECT_FALSE(lockByte(readOnly.get(), 0, 10s));
    EXPECT_LT(std::chrono::steady_clock::now() - begun, 5s);
}
