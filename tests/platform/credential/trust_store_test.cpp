// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovrabase/encoding.h>
#include <ovraplatform/trust_store.h>

#include <gtest/gtest.h>

#include <chrono>
#include <csignal>
#include <thread>

namespace {

using namespace OvraPlatform;
using namespace std::chrono_literals;

std::string fingerprint(const std::string &of) {
    OvraBase::sodiumReady();
    return OvraBase::fingerprintOf(reinterpret_cast<const unsigned char *>(of.data()), of.size());
}

class TrustScene : public OvraTest::OwnFiles {
protected:
    std::string file() const { return path("known_endpoints"); }
    TrustStore store() const { return TrustStore(file()); }
};

TEST_F(TrustScene, TrustsTheKeyThatAnEndpointHadFirst) {
    const std::string key = fingerprint("a");
    EXPECT_EQ(store().lookup("https://a:1", key), TrustVerdict::kUnknown);
    EXPECT_EQ(store().pin("https://a:1", key), TrustVerdict::kTrusted);
    EXPECT_EQ(store().lookup("https://a:1", key), TrustVerdict::kTrusted);
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("b")), TrustVerdict::kDifferent);
    EXPECT_EQ(store().pin("https://a:1", fingerprint("b")), TrustVerdict::kDifferent);
    for (const char *other : {"http://a:1", "https://a:2", "https://b:1"}) {
        EXPECT_EQ(store().lookup(other, key), TrustVerdict::kUnknown) << other;
    }
    EXPECT_EQ(OvraTest::modeOf(file()), 0600U);
}

TEST_F(TrustScene, ForgetsOneEndpointAndListsTheOthers) {
    EXPECT_TRUE(store().forget("https://a:1"));
    for (const char *endpoint : {"https://a:1", "https://b:1", "https://c:1"}) {
        store().pin(endpoint, fingerprint(endpoint));
    }
    EXPECT_TRUE(store().forget("https://b:1"));
    EXPECT_EQ(store().lookup("https://b:1", fingerprint("https://b:1")), TrustVerdict::kUnknown);
    const auto entries = store().list();
    ASSERT_TRUE(entries);
    ASSERT_EQ(entries->size(), 2U);
    EXPECT_EQ(entries->front().endpoint, "https://a:1");
    EXPECT_EQ(entries->back().fingerprint, fingerprint("https://c:1"));
}

TEST_F(TrustScene, KeepsLinesThatItDoesNotUnderstand) {
    const std::string strange = "# a comment\n\nhttps://a:1 SHA256:short\nrubbish\n"
                                "https://b:1  " +
                                fingerprint("b") + "\n";
    OvraTest::writeFile(file(), strange + "https://c:1 " + fingerprint("c")); // no newline
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("a")), TrustVerdict::kUnknown);
    EXPECT_EQ(store().lookup("https://b:1", fingerprint("b")), TrustVerdict::kUnknown);
    EXPECT_EQ(store().lookup("https://c:1", fingerprint("c")), TrustVerdict::kTrusted);
    EXPECT_EQ(store().pin("https://a:1", fingerprint("a")), TrustVerdict::kTrusted);
    EXPECT_TRUE(OvraTest::readFile(file()).starts_with(strange));
    EXPECT_EQ(store().lookup("https://c:1", fingerprint("c")), TrustVerdict::kTrusted);
}

TEST_F(TrustScene, CountsTheFirstOfTwoLines) {
    OvraTest::writeFile(file(), "https://a:1 " + fingerprint("1") + "\nhttps://a:1 " +
                                    fingerprint("2") + "\n");
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("2")), TrustVerdict::kDifferent);
    EXPECT_EQ(store().list()->size(), 1U);
    EXPECT_TRUE(store().forget("https://a:1"));
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("2")), TrustVerdict::kUnknown);
}

TEST_F(TrustScene, RefusesToJudgeWithoutItsFile) {
    std::filesystem::create_directory(file());
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("a")), TrustVerdict::kUnavailable);
    EXPECT_EQ(store().pin("https://a:1", fingerprint("a")), TrustVerdict::kUnavailable);
    EXPECT_FALSE(store().list());
    EXPECT_FALSE(store().forget("https://a:1"));
}

TEST_F(TrustScene, KeepsTheOldKeysWhenTheDiskIsFull) {
    store().pin("https://a:1", fingerprint("a"));
    const std::string before = OvraTest::readFile(file());
    OvraTest::OtherProcess full([this, &before] {
        OvraTest::limitFileSize(before.size() + 10);
        return static_cast<int>(store().pin("https://b:1", fingerprint("b")));
    });
    EXPECT_EQ(full.wait(), static_cast<int>(TrustVerdict::kUnavailable));
    EXPECT_EQ(OvraTest::readFile(file()), before);
}

TEST_F(TrustScene, LosesNoKeyOfProcessesThatPinAtOnce) {
    const auto pinMany = [this](const std::string &name) {
        return [this, name] {
            for (int i = 0; i < 25; ++i) {
                store().pin("https://" + name + ":" + std::to_string(i), fingerprint(name));
            }
            return 0;
        };
    };
    OvraTest::OtherProcess one(pinMany("one"));
    OvraTest::OtherProcess two(pinMany("two"));
    EXPECT_EQ(one.wait(), 0);
    EXPECT_EQ(two.wait(), 0);
    EXPECT_EQ(store().list()->size(), 50U);
}

TEST_F(TrustScene, SurvivesTheDeathOfAWriter) {
    store().pin("https://first:1", fingerprint("first"));
    std::size_t atLeast = 1;
    for (int round = 0; round < 10; ++round) {
        OvraTest::OtherProcess writer([this, round] {
            for (int i = 0;; ++i) {
                store().pin("https://r" + std::to_string(round) + ":" + std::to_string(i),
                            fingerprint("x"));
            }
            return 0;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(5 + round));
        writer.end(SIGKILL);
        const auto entries = store().list();
        ASSERT_TRUE(entries);
        EXPECT_GE(entries->size(), atLeast);
        EXPECT_EQ(store().lookup("https://first:1", fingerprint("first")), TrustVerdict::kTrusted);
        atLeast = entries->size();
    }
    EXPECT_EQ(store().pin("https://last:1", fingerprint("last")), TrustVerdict::kTrusted);
}

} // namespace
