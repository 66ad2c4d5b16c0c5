// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovrabase/encoding.h>
#include <ovraplatform/trust_store.h>

#include <gtest/gtest.h>

namespace {

using namespace OvraPlatform;

std::string fingerprint(const std::string &of) {
    OvraBase::sodiumReady();
    return OvraBase::fingerprintOf(reinterpret_cast<const unsigned char *>(of.data()), of.size());
}

class TrustScene : public OvraTest::OwnFiles {
protected:
    std::string file() const { return path("known_endpoints"); }
    TrustStore store() const { return TrustStore(file()); }
};

TEST_F(TrustScene, TrustsTheKeyThatAnEndpointHadFirstUntilItForgets) {
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
    store().pin("https://b:1", key);
    store().pin("https://c:1", fingerprint("c"));
    EXPECT_TRUE(store().forget("https://b:1"));
    EXPECT_EQ(store().lookup("https://b:1", key), TrustVerdict::kUnknown);
    const auto entries = store().list().value();
    ASSERT_EQ(entries.size(), 2U);
    EXPECT_EQ(entries[0].endpoint, "https://a:1");
    EXPECT_EQ(entries[1].fingerprint, fingerprint("c"));
}

TEST_F(TrustScene, KeepsLinesThatCountForNothingAndRefusesToJudgeWithoutItsFile) {
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
    // The first of two lines counts.
    OvraTest::writeFile(file(), "https://a:1 " + fingerprint("1") + "\nhttps://a:1 " +
                                    fingerprint("2") + "\n");
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("2")), TrustVerdict::kDifferent);
    EXPECT_EQ(store().list()->size(), 1U);
    EXPECT_TRUE(store().forget("https://a:1"));
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("2")), TrustVerdict::kUnknown);
    std::filesystem::remove(file());
    std::filesystem::create_directory(file());
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("a")), TrustVerdict::kUnavailable);
    EXPECT_EQ(store().pin("https://a:1", fingerprint("a")), TrustVerdict::kUnavailable);
    EXPECT_FALSE(store().list());
    EXPECT_FALSE(store().forget("https://a:1"));
}

TEST_F(TrustScene, LosesNoKeyOfProcessesThatPinAtOnce) {
    const auto pinMany = [this](const std::string &name) {
        for (int i = 1; i <= 25; ++i) {
            store().pin("https://" + name + ":" + std::to_string(i), fingerprint(name));
        }
        return 0;
    };
    OvraTest::OtherProcess other([&] { return pinMany("other"); });
    pinMany("own");
    EXPECT_EQ(other.wait(), 0);
    EXPECT_EQ(store().list()->size(), 50U);
}

} // namespace
