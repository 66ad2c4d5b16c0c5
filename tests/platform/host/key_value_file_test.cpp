// SPDX-License-Identifier: Apache-2.0
#include "host/key_value_file.h"
#include "platform/own_files.h"

#include <ovrabase/file.h>
#include <ovracore/ovracore.h>

#include <fcntl.h>
#include <sys/file.h>

#include <array>
#include <chrono>
#include <optional>
#include <thread>

using namespace OvraTest;

namespace {

constexpr char kFormat[] = "%s=\"%s\"\n";

struct KeyValueFile : OvraTest::OwnFiles {
    std::string file() const { return path("settings.conf"); }
    int set(const char *key, const char *value) const {
        return OLIBCFileSetKeyValue(file().c_str(), key, value, kFormat);
    }
    std::string get(const char *key) const {
        std::array<char, 4096> buffer{};
        const int length = OLIBCFileGetKeyValue(file().c_str(), key, buffer.data(),
                                                static_cast<int>(buffer.size()), 0);
        return length < 0 ? "(none)" : std::string(buffer.data(), static_cast<std::size_t>(length));
    }
};

TEST(KeyValueText, ReadsTheUsualWaysToWriteALine) {
    const std::pair<const char *, std::optional<std::string>> rows[] = {
        {"key=\"a value\"\n", "a value"},
        {"key=value", "value"},
        {"  key = value \t\r\n", "value"},
        {"key=\"# = inside\" # comment\n", "# = inside"},
        {"key=value # comment\n", "value"},
        {"key=va#lue\n", "va#lue"},
        {"key=#value\n", "#value"},
        {"key=\n", ""},
        {"key=\"\"\n", ""},
        {"key=\"first\"\nkey=\"last\"\n", "last"},
        {"key=\"good\"\nkey=\"cut off\n", "good"},
        {"key=\"a\"b\"\n", std::nullopt},
        {"#key=\"value\"\n", std::nullopt},
        {"key\n=value\nkeys=value\nKEY=value\n", std::nullopt},
        {"", std::nullopt},
    };
    for (const auto &[text, value] : rows) {
        EXPECT_EQ(OvraPlatform::findKeyValue(text, "key"), value) << text;
    }
}

TEST_F(KeyValueFile, ChangesOneLineAndKeepsTheOthersByteForByte) {
    const std::string before = "# made by hand\r\n\tother = 1\n\x01\xFFgarbage\n";
    const std::string after = "\n\n  last=\"no newline\"";
    writeFile(file(), before + " node_id = old # note\r\n" + after);
    ASSERT_GE(set("node_id", "new"), 0);
    ASSERT_GE(set("added", "x"), 0);
    EXPECT_EQ(readFile(file()), before + "node_id=\"new\"\n" + after + "\nadded=\"x\"\n");
}

TEST_F(KeyValueFile, WhatWouldNotReadBackIsRefusedAndNothingIsChangedOrCut) {
    const std::array<const char *, 3> rows[] = {
        {"k", "a\"b", kFormat},  {"k", "a\nevil=\"1\"", kFormat},
        {"k=x", "v", kFormat},   {"", "v", kFormat},
        {"#k", "v", kFormat},    {"k", "v", "%s=\"%s\""},
        {"k", "v", "%s=%d\n"},   {"k", "v", "%s=\n"},
        {"k", "v", "%s=%s%s\n"}, {"k", " v ", "%s=%s\n"},
        {"k", "v", "x%s=%s\n"},  {"k", "v", "%s=%s\n%%\n"},
        {"k", nullptr, kFormat},
    };
    writeFile(file(), "k=\"old\"\n");
    for (const auto &[key, value, format] : rows) {
        EXPECT_LT(OLIBCFileSetKeyValue(file().c_str(), key, value, format), 0) << key << format;
    }
    EXPECT_EQ(readFile(file()), "k=\"old\"\n");
    writeFile(file(), std::string(3 << 20, 'x')); // no file of settings
    EXPECT_EQ(get("k"), "(none)");
    EXPECT_LT(set("k", "v"), 0);
    EXPECT_EQ(std::filesystem::file_size(file()), 3U << 20U);
    writeFile(file(), "key=\"12345\"\n");
    std::array<char, 6> buffer{};
    EXPECT_EQ(OLIBCFileGetKeyValue(file().c_str(), "key", buffer.data(), 6, 0), 5);
    EXPECT_STREQ(buffer.data(), "12345");
    EXPECT_EQ(OLIBCFileGetKeyValue(file().c_str(), "key", buffer.data(), 5, 0), -1);
    EXPECT_STREQ(buffer.data(), "");
    EXPECT_EQ(OLIBCFileGetKeyValue(path("absent").c_str(), "key", buffer.data(), 6, 0), -1);
}

TEST_F(KeyValueFile, AChangeWaitsForTheOneUnderWaySoThatNeitherIsLost) {
    umask(077);
    ASSERT_GE(set("mine", "old"), 0);
    EXPECT_EQ(modeOf(file()), 0644U) << "anybody may read it";
    EXPECT_EQ(modeOf(path(".lock")), 0600U);
    const OvraBase::UniqueFd folder(open(path("").c_str(), O_RDONLY)); // as anybody may
    ASSERT_EQ(flock(folder.get(), LOCK_EX), 0);
    std::optional<OvraBase::FileUpdate> underWay = OvraBase::FileUpdate::begin(file()).value();
    OtherProcess other([&] { return set("other", "new") < 0 ? 1 : 0; });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    ASSERT_TRUE(underWay->commit("mine=\"new\"\n", 0644));
    underWay.reset();
    EXPECT_EQ(other.wait(), 0);
    EXPECT_EQ(readFile(file()), "mine=\"new\"\nother=\"new\"\n");
}

TEST_F(KeyValueFile, AFullDiskOrAWriterKilledAtAnyMomentLeavesAWholeFile) {
    const std::string big(2000, 'x');
    ASSERT_GE(set("key", ("0" + big).c_str()), 0);
    OtherProcess full([&] {
        limitFileSize(64); // a full disk
        return set("key", big.c_str()) < 0 ? 0 : 1;
    });
    EXPECT_EQ(full.wait(), 0);
    EXPECT_EQ(get("key"), "0" + big);
    for (int round = 0; round < 15; ++round) {
        OtherProcess writer([&] {
            for (int i = 0;; ++i) {
                set("key", (std::to_string(i) + big).c_str());
            }
            return 0;
        });
        std::this_thread::sleep_for(std::chrono::microseconds(1000 + 997 * round));
        writer.end(SIGKILL);
        const std::string value = get("key");
        ASSERT_GT(value.size(), big.size());
        EXPECT_EQ(value.substr(value.size() - big.size()), big);
    }
    EXPECT_GE(set("key", "done"), 0);
    EXPECT_EQ(readFile(file()), "key=\"done\"\n");
    EXPECT_FALSE(std::filesystem::exists(file() + ".new"));
}

} // namespace
