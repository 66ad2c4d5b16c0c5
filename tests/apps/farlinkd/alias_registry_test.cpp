// SPDX-License-Identifier: Apache-2.0
#include "alias_registry.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

namespace {

using Farlinkd::Alias;
using Farlinkd::AliasRegistry;
using Refusal = AliasRegistry::Refusal;

constexpr char kFile[] = "/usr/ovra/aliases";
constexpr AliasRegistry::Limits kLimits{6000, 6002, std::chrono::seconds(100), 2};

constexpr int refused(Refusal refusal) {
    return -1 - static_cast<int>(refusal);
}

/// The port assigned to the key for the alias, or refused() of the refusal.
int enrol(AliasRegistry &registry, const std::string &name, const std::string &key,
          std::int64_t now) {
    const auto enrolled = registry.enrol(name, key, now);
    return enrolled ? enrolled->alias.port : refused(enrolled.error());
}

} // namespace

TEST(AliasRegistry, AnAliasStaysWithItsKeyUntilTheLeaseIsOver) {
    AliasRegistry registry(kFile, kLimits);
    EXPECT_EQ(enrol(registry, "nas", "key1", 0), 6000);
    EXPECT_EQ(enrol(registry, "nas", "key2", 99), refused(Refusal::kTaken));
    EXPECT_EQ(enrol(registry, "nas", "key1", 99), 6000) << "renewed";
    EXPECT_TRUE(registry.dropExpired(198).empty());
    EXPECT_EQ(enrol(registry, "nas", "key2", 198), refused(Refusal::kTaken));
    EXPECT_EQ(registry.dropExpired(199).size(), 1U);
    EXPECT_FALSE(registry.find("nas"));
    EXPECT_EQ(enrol(registry, "nas", "key2", 199), 6001)
        << "a port that the last callers do not know";
}

TEST(AliasRegistry, PortsGoRoundAndAreBounded) {
    AliasRegistry registry(kFile, kLimits);
    EXPECT_EQ(enrol(registry, "one", "key1", 0), 6000);
    EXPECT_EQ(enrol(registry, "two", "key1", 0), 6001);
    EXPECT_EQ(enrol(registry, "three", "key1", 0), refused(Refusal::kTooMany));
    EXPECT_TRUE(registry.release("one"));
    EXPECT_EQ(enrol(registry, "three", "key2", 0), 6002);
    EXPECT_EQ(enrol(registry, "four", "key2", 0), 6000);
    EXPECT_EQ(enrol(registry, "five", "key3", 0), refused(Refusal::kFull));
}

TEST(AliasRegistry, IsTheSameAfterARestartAndRefusesRubbish) {
    {
        AliasRegistry registry(kFile, kLimits);
        EXPECT_TRUE(registry.load()) << "a missing file is an empty registry";
        enrol(registry, "nas", "key1", 0);
        enrol(registry, "gone", "key2", 0);
        EXPECT_TRUE(registry.release("gone"));
    }
    struct stat status {};
    ASSERT_EQ(stat(kFile, &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
    AliasRegistry registry(kFile, kLimits);
    ASSERT_TRUE(registry.load());
    EXPECT_EQ(enrol(registry, "nas", "key2", 0), refused(Refusal::kTaken));
    EXPECT_EQ(enrol(registry, "new", "key2", 0), 6002);

    // Half a list would free the other aliases, for somebody else to take.
    for (const char *damaged : {"rubbish", "farlink-aliases-2 6000\n", "farlink-aliases-1 6000 1\n",
                                "farlink-aliases-1 6000\nnas x 9 key1\nnew 6002 9 key2\n",
                                "farlink-aliases-1 6000\nnas 6000 9\nnew 6002 9 key2\n",
                                "farlink-aliases-1 6000\nN 6000 9 key1\n"}) {
        std::ofstream(kFile) << damaged;
        const auto refusedFile = AliasRegistry(kFile, kLimits).load();
        ASSERT_FALSE(refusedFile) << damaged;
        EXPECT_NE(refusedFile.error().text.find(kFile), std::string::npos);
    }
    std::filesystem::remove(kFile);
    std::filesystem::create_directory(kFile);
    EXPECT_EQ(enrol(registry, "more", "key3", 0), refused(Refusal::kNotStored));
    EXPECT_FALSE(registry.find("more")) << "what is not stored does not hold";
}

TEST(AliasRegistry, TakesFromItsFileWhatFitsItsPorts) {
    std::ofstream(kFile) << "farlink-aliases-1 6002\nfirst 6000 9 key1\nlow 5999 9 key1\n"
                            "high 6003 9 key1\ntwice 6000 9 key1\n"
                            "last 6002 9 key2\n";
    AliasRegistry registry(kFile, kLimits);
    ASSERT_TRUE(registry.load());
    std::string names;
    for (const Alias &alias : registry.list()) {
        names += alias.name + " ";
    }
    EXPECT_EQ(names, "first last ");
    EXPECT_EQ(enrol(registry, "last", "key3", 8), refused(Refusal::kTaken));
    EXPECT_EQ(enrol(registry, "last", "key3", 9), 6002) << "its lease is over";
    EXPECT_EQ(enrol(registry, "new", "key3", 9), 6001) << "the only free one, after a round";
}
