// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"

#include <ovrabase/encoding.h>
#include <ovraplatform/trust_store.h>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <ctime>

namespace {

using namespace OvraPlatform;

std::string fingerprint(const std::string &of) {
    OvraBase::sodiumReady();
    return OvraBase::fingerprintOf(reinterpret_cast<const unsigned char *>(of.data()), of.size());
}

using V = TrustVerdict;

class TrustScene : public OvraTest::OwnFiles {
protected:
    std::string file() const { return path("known_endpoints"); }
    TrustStore store() const { return TrustStore(file()); }
};

TEST_F(TrustScene, TrustsTheKeyThatAnEndpointHadFirstUntilAPersonForgets) {
    const std::string key = fingerprint("a");
    EXPECT_TRUE(store().create());
    EXPECT_EQ(store().lookup("https://a:1", key), V::kUnknown);
    EXPECT_EQ(store().pin("https://a:1", key), V::kTrusted);
    EXPECT_EQ(store().pin("https://a:1", fingerprint("b")), V::kDifferent);
    EXPECT_EQ(store().trust("https://a:1", fingerprint("b"), false), V::kDifferent);
    EXPECT_EQ(store().lookup("https://a:1", key), V::kTrusted);
    for (const char *other : {"http://a:1", "https://a:2", "https://b:1", "flk:a"}) {
        EXPECT_EQ(store().lookup(other, key), V::kUnknown) << other;
    }
    EXPECT_EQ(OvraTest::modeOf(file()), 0600U);
    EXPECT_EQ(store().vouch("https://b:1"), V::kVouched);
    EXPECT_EQ(store().vouch("flk:b"), V::kUnavailable) << "nobody vouches for an alias";
    for (const char *known : {"https://a:1", "https://b:1"}) {
        EXPECT_TRUE(store().forget(known));
        EXPECT_EQ(store().pin(known, key), V::kForgotten) << "only a person trusts it again";
        EXPECT_EQ(store().vouch(known), V::kForgotten);
    }
    EXPECT_EQ(store().trust("https://b:1", key, false), V::kTrusted);
    EXPECT_EQ(store().trust("https://b:1", fingerprint("b"), true), V::kTrusted);
    const std::string since = std::to_string(store().list()->at(1).since);
    EXPECT_LT(std::time(nullptr) - std::stoll(since), 60) << "since then it is trusted";
    const std::string value = fingerprint("b");
    const std::string lines = "# ovradr-trust 1\nhttps://a:1 forgotten\nhttps://b:1 " + value +
                              "\n#since " + since + " https://b:1 " + value.substr(0, 15) + "\n";
    EXPECT_EQ(OvraTest::readFile(file()), lines);
    // Another key, written in by hand, has not been trusted since then.
    OvraTest::writeFile(file(), std::string(lines).replace(lines.find(value), value.size(), key));
    EXPECT_EQ(store().list()->at(1).since, 0);
}

TEST_F(TrustScene, TakesNobodyForUnknownWithoutASoundFile) {
    const std::string head = "# ovradr-trust 1\n";
    const std::string a = "https://a:1 " + fingerprint("a") + "\n";
    const struct {
        const char *name;
        std::optional<std::string> text;
        V a;     ///< of the endpoint a
        V other; ///< of one that is not named
        bool gone = false;
    } files[] = {
        {"missing", std::nullopt, V::kLost, V::kLost, true},
        {"empty", "", V::kLost, V::kLost, true},
        {"only a comment", "# a comment\n\n", V::kLost, V::kLost, true},
        {"of the version before", a, V::kTrusted, V::kUnknown},
        {"sound", head + "# a comment\n" + a, V::kTrusted, V::kUnknown},
        {"the first of two counts", head + "https://a:1 system\n" + a, V::kVouched, V::kUnknown},
        {"a cut line", head + "https://a:1 SHA256:short\n" + a, V::kLost, V::kLost},
        {"a line without value", head + "https://a:1", V::kLost, V::kLost},
        {"rubbish beside it", head + a + "rubbish", V::kTrusted, V::kLost},
        {"zeros", std::string(300, '\0'), V::kLost, V::kLost},
        {"of a newer version", "# ovradr-trust 2\n" + a, V::kUnavailable, V::kUnavailable},
    };
    for (const auto &each : files) {
        if (each.text) {
            OvraTest::writeFile(file(), *each.text);
        }
        const std::string key = fingerprint("a");
        EXPECT_EQ(store().lookup("https://a:1", key), each.a) << each.name;
        EXPECT_EQ(store().lookup("https://b:1", key), each.other) << each.name;
        EXPECT_EQ(store().problem().empty(), each.other == V::kUnknown) << each.name;
        const bool unknown = each.other == V::kUnknown;
        EXPECT_EQ(store().pin("https://b:1", key), unknown ? V::kTrusted : each.other) << each.name;
        EXPECT_EQ(store().vouch("https://c:1"), unknown ? V::kVouched : each.other) << each.name;
        // A person's word counts, and nothing else is lost by it.
        const V said = each.a == V::kUnavailable ? V::kUnavailable : V::kTrusted;
        EXPECT_EQ(store().trust("https://d:1", key, false), said) << each.name;
        EXPECT_EQ(store().lookup("https://d:1", key), said) << each.name;
        const std::string now = OvraTest::readFile(file());
        EXPECT_EQ(now.starts_with(head), said == V::kTrusted) << each.name;
        EXPECT_NE(now.find(each.text.value_or("")), std::string::npos) << each.name;
        EXPECT_EQ(store().lookup("https://e:1", key), each.other) << each.name;
        EXPECT_EQ(store().create(), unknown || each.gone) << each.name;
        EXPECT_EQ(store().problem().empty(), unknown || each.gone) << each.name;
        std::filesystem::remove(file());
    }
    std::filesystem::create_directory(file());
    EXPECT_EQ(store().lookup("https://a:1", fingerprint("a")), V::kUnavailable);
    EXPECT_EQ(store().trust("https://a:1", fingerprint("a"), true), V::kUnavailable);
    EXPECT_FALSE(store().list() || store().forget("https://a:1") || store().create());
}

TEST_F(TrustScene, ALackOfDescriptorsSaysNothingOfAKey) {
    EXPECT_TRUE(store().create());
    rlimit own{};
    getrlimit(RLIMIT_NOFILE, &own);
    const rlimit none{0, own.rlim_max};
    setrlimit(RLIMIT_NOFILE, &none);
    const V looked = store().lookup("https://a:1", fingerprint("a"));
    const V pinned = store().pin("https://a:1", fingerprint("a"));
    setrlimit(RLIMIT_NOFILE, &own);
    EXPECT_TRUE(looked == V::kShortage && pinned == V::kShortage);
}

TEST_F(TrustScene, LosesNoKeyOfProcessesThatPinAtOnce) {
    EXPECT_TRUE(store().create());
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
