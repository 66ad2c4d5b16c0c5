// SPDX-License-Identifier: Apache-2.0
#include "alias_book.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

namespace {

using Farlinkd::Alias;
using Farlinkd::AliasBook;
using Outcome = AliasBook::Outcome;

constexpr char kFile[] = "/usr/ovra/aliases";
constexpr AliasBook::Limits kLimits{6000, 6002, std::chrono::seconds(100), 2};

/// The port that the key got for the alias, or minus the outcome.
int enrol(AliasBook &book, const std::string &name, const std::string &key, std::int64_t now) {
    Alias alias;
    const Outcome outcome = book.enrol(name, key, now, alias);
    return outcome == Outcome::kMade || outcome == Outcome::kRenewed ? alias.port
                                                                     : -static_cast<int>(outcome);
}

constexpr int refused(Outcome outcome) {
    return -static_cast<int>(outcome);
}

} // namespace

TEST(AliasBook, AnAliasStaysWithItsKeyUntilTheLeaseIsOver) {
    AliasBook book(kFile, kLimits);
    EXPECT_EQ(enrol(book, "nas", "key1", 0), 6000);
    EXPECT_EQ(enrol(book, "nas", "key2", 99), refused(Outcome::kTaken));
    EXPECT_EQ(enrol(book, "nas", "key1", 99), 6000) << "renewed";
    EXPECT_TRUE(book.dropExpired(198).empty());
    EXPECT_EQ(enrol(book, "nas", "key2", 198), refused(Outcome::kTaken));
    EXPECT_EQ(book.dropExpired(199).size(), 1U);
    EXPECT_EQ(book.find("nas"), nullptr);
    EXPECT_EQ(enrol(book, "nas", "key2", 199), 6001) << "a port that the last callers do not know";
}

TEST(AliasBook, PortsGoRoundAndAreBounded) {
    AliasBook book(kFile, kLimits);
    EXPECT_EQ(enrol(book, "one", "key1", 0), 6000);
    EXPECT_EQ(enrol(book, "two", "key1", 0), 6001);
    EXPECT_EQ(enrol(book, "three", "key1", 0), refused(Outcome::kTooMany));
    EXPECT_TRUE(book.release("one"));
    EXPECT_EQ(enrol(book, "three", "key2", 0), 6002);
    EXPECT_EQ(enrol(book, "four", "key2", 0), 6000);
    EXPECT_EQ(enrol(book, "five", "key3", 0), refused(Outcome::kFull));
}

TEST(AliasBook, IsTheSameAfterARestartAndRefusesRubbish) {
    std::string why;
    {
        AliasBook book(kFile, kLimits);
        EXPECT_TRUE(book.load(why)) << "a missing file is an empty book";
        enrol(book, "nas", "key1", 0);
        enrol(book, "gone", "key2", 0);
        book.release("gone");
    }
    struct stat status {};
    ASSERT_EQ(stat(kFile, &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
    AliasBook book(kFile, kLimits);
    ASSERT_TRUE(book.load(why)) << why;
    EXPECT_EQ(enrol(book, "nas", "key2", 0), refused(Outcome::kTaken));
    EXPECT_EQ(enrol(book, "new", "key2", 0), 6002);

    std::ofstream(kFile) << "rubbish";
    EXPECT_FALSE(AliasBook(kFile, kLimits).load(why));
    EXPECT_NE(why.find(kFile), std::string::npos) << why;
    std::filesystem::remove(kFile);
    std::filesystem::create_directory(kFile);
    EXPECT_EQ(enrol(book, "more", "key3", 0), refused(Outcome::kNotStored));
    EXPECT_EQ(book.find("more"), nullptr) << "what is not stored does not hold";
}
