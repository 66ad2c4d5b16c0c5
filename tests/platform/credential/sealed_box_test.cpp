// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "seal/sealing.h"

#include <ovradrcore/json.h>
#include <ovraplatform/sealed_box.h>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <vector>

namespace {

using namespace OvraPlatform;

constexpr UnixMillis kStart = 1'700'000'000'000;

/// A system clock and a steady clock that stand still until advanced.
struct FakeTime {
    UnixMillis wall = kStart;
    UnixMillis steady = 5000;

    ReplayGuard::Clocks clocks() {
        return {[this] { return wall; }, [this] { return steady; }};
    }
    void pass(UnixMillis time) {
        wall += time;
        steady += time;
    }
};

SealNonce nonce(unsigned char value) {
    SealNonce made{};
    made.fill(value);
    return made;
}

class SealScene : public OvraTest::OwnFiles {
protected:
    SealKeyPair newKeys(const std::string &name = "key") {
        return SealKeyPair::loadOrCreate(path(name)).value();
    }
    static WireCall secretCall() {
        WireCall call{{"OVRA.Core.Auth", 1, "login"}};
        call.params["passwd"] = "hunter2";
        call.sid = "session-1";
        return call;
    }
    /// The transmitted request: the call with only its envelope.
    static WireCall seal(const SealKeyPair &keys, const WireCall &call, UnixMillis time,
                         ReplyKey &replyKey) {
        WireCall outer{{call.api, call.version, call.method}};
        const auto sealed = sealRequest(keys.publicKey(), call, time).value();
        outer.sealed = sealed.envelope;
        replyKey = sealed.replyKey;
        return outer;
    }
    SealVerdict open(const SealKeyPair &keys, const WireCall &outer) {
        return openRequest(keys, outer, guard_, opened_);
    }

    FakeTime time_;
    ReplayGuard guard_{time_.clocks()};
    ReplyKey replyKey_;
    OpenedRequest opened_;
};

TEST_F(SealScene, CarriesParametersAndSessionToTheOneReceiver) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall(), kStart, replyKey_);
    EXPECT_EQ(open(newKeys("other"), outer), SealVerdict::kUnreadable);
    ASSERT_EQ(open(keys, outer), SealVerdict::kOpened);
    EXPECT_EQ(opened_.call.params["passwd"], "hunter2");
    EXPECT_EQ(opened_.call.sid, "session-1");
    EXPECT_EQ(opened_.replyKey, replyKey_);
}

TEST_F(SealScene, IsSeenOnce) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall(), kStart, replyKey_);
    EXPECT_EQ(open(keys, outer), SealVerdict::kOpened);
    EXPECT_EQ(open(keys, outer), SealVerdict::kReplayed);
}

TEST_F(SealScene, IsGoodForItsOwnCallOnly) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall(), kStart, replyKey_);
    for (const APICall &other :
         {APICall{"Other", 1, "login"}, APICall{"OVRA.Core.Auth", 2, "login"},
          APICall{"OVRA.Core.Auth", 1, "logout"}}) {
        WireCall moved{other};
        moved.sealed = outer.sealed;
        EXPECT_EQ(open(keys, moved), SealVerdict::kOtherCall) << other.api << other.method;
    }
}

TEST_F(SealScene, DoesNotOpenWhenAnyPartOfItIsChanged) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall(), kStart, replyKey_);
    for (std::size_t i = 0; i < outer.sealed.size(); i += 7) {
        WireCall changed = outer;
        changed.sealed[i] = changed.sealed[i] == 'A' ? 'B' : 'A';
        EXPECT_EQ(open(keys, changed), SealVerdict::kUnreadable) << i;
    }
    for (const std::string &text : {std::string("A"), std::string("!!"), outer.sealed.substr(4)}) {
        WireCall changed = outer;
        changed.sealed = text;
        EXPECT_EQ(open(keys, changed), SealVerdict::kUnreadable) << text.size();
    }
}

TEST_F(SealScene, DoesNotShowTheLengthOfAPassword) {
    const SealKeyPair keys = newKeys();
    WireCall call = secretCall();
    const std::size_t size = seal(keys, call, kStart, replyKey_).sealed.size();
    call.params["passwd"] = "a much longer password than it";
    EXPECT_EQ(seal(keys, call, kStart, replyKey_).sealed.size(), size);
}

TEST_F(SealScene, BringsTheReplyBackToItsSenderOnly) {
    const std::string document = R"({"success":true,"data":{"sid":"s"}})";
    newKeys(); // initialises libsodium
    randombytes_buf(replyKey_.data(), replyKey_.size());
    const std::string text = sealReply(replyKey_, document);
    EXPECT_EQ(text.find("sid"), std::string::npos);
    Json::Value reply;
    ASSERT_TRUE(OvraDRCore::fromString(reply, text));
    EXPECT_EQ(openReply(replyKey_, reply), document);

    ReplyKey other = replyKey_;
    other[0] ^= 1U;
    EXPECT_FALSE(openReply(other, reply));
    std::string changed = reply["sealed_reply"].asString();
    changed[40] = changed[40] == 'A' ? 'B' : 'A';
    reply["sealed_reply"] = changed;
    EXPECT_FALSE(openReply(replyKey_, reply));
    EXPECT_FALSE(openReply(replyKey_, Json::Value("x")));
}

TEST_F(SealScene, KeepsItsKeyInAFileOfItsOwnerOnly) {
    const SealKeyPair made = newKeys();
    EXPECT_EQ(OvraTest::modeOf(path("key")), 0600U);
    EXPECT_EQ(newKeys().publicKey(), made.publicKey()) << "an existing key must be kept";

    ASSERT_EQ(chmod(path("key").c_str(), 0640), 0);
    EXPECT_FALSE(SealKeyPair::load(path("key")));
    const std::string text = OvraTest::readFile(path("key"));
    for (const std::string &damaged : {std::string(), std::string("x"), text.substr(0, 30)}) {
        OvraTest::writeFile(path("key"), damaged);
        ASSERT_EQ(chmod(path("key").c_str(), 0600), 0);
        EXPECT_FALSE(SealKeyPair::load(path("key"))) << damaged.size();
        const auto kept = SealKeyPair::loadOrCreate(path("key"));
        ASSERT_FALSE(kept) << "must not be replaced";
        EXPECT_EQ(kept.error().find(text.substr(20, 10)), std::string::npos)
            << "no key in a message";
    }
}

TEST_F(SealScene, HasOneKeyWhenTwoProcessesMakeItAtOnce) {
    for (int round = 0; round < 20; ++round) {
        const std::string name = "key" + std::to_string(round);
        const auto make = [&, this](const std::string &result) {
            return [=, this] {
                OvraTest::writeFile(path(result), publicKeyText(newKeys(name).publicKey()));
                return 0;
            };
        };
        OvraTest::OtherProcess one(make("one"));
        OvraTest::OtherProcess two(make("two"));
        EXPECT_EQ(one.wait(), 0);
        EXPECT_EQ(two.wait(), 0);
        EXPECT_EQ(OvraTest::readFile(path("one")), OvraTest::readFile(path("two")));
        EXPECT_EQ(OvraTest::readFile(path("one")), publicKeyText(newKeys(name).publicKey()));
    }
}

TEST(ReplayGuard, TakesWhatIsStampedWithinItsWindow) {
    FakeTime time;
    ReplayGuard guard(time.clocks());
    time.pass(100'000);
    const UnixMillis now = guard.now();
    using V = ReplayGuard::Verdict;
    EXPECT_EQ(guard.admit(now - ReplayGuard::kMaxPast + 1, nonce(1)), V::kFresh);
    EXPECT_EQ(guard.admit(now - ReplayGuard::kMaxPast, nonce(2)), V::kStale);
    EXPECT_EQ(guard.admit(now + ReplayGuard::kMaxFuture, nonce(3)), V::kFresh);
    EXPECT_EQ(guard.admit(now + ReplayGuard::kMaxFuture + 1, nonce(4)), V::kStale);
}

TEST(ReplayGuard, TakesNothingFromBeforeItsStart) {
    FakeTime time;
    ReplayGuard guard(time.clocks());
    EXPECT_EQ(guard.admit(kStart - 1, nonce(1)), ReplayGuard::Verdict::kStale);
    EXPECT_EQ(guard.admit(kStart, nonce(1)), ReplayGuard::Verdict::kFresh);
}

TEST(ReplayGuard, RefusesARepetitionAsLongAsItIsFreshAndAfterwards) {
    FakeTime time;
    ReplayGuard guard(time.clocks());
    const UnixMillis stamp = kStart + ReplayGuard::kMaxFuture;
    ASSERT_EQ(guard.admit(stamp, nonce(1)), ReplayGuard::Verdict::kFresh);
    for (int i = 0; i < 100; ++i) {
        time.pass(1000);
        EXPECT_NE(guard.admit(stamp, nonce(1)), ReplayGuard::Verdict::kFresh) << i;
    }
}

TEST(ReplayGuard, DoesNotForgetWhenTheClockIsSetBack) {
    FakeTime time;
    ReplayGuard guard(time.clocks());
    ASSERT_EQ(guard.admit(kStart, nonce(1)), ReplayGuard::Verdict::kFresh);
    time.pass(200'000);
    time.wall -= 200'000;
    EXPECT_EQ(guard.admit(kStart, nonce(1)), ReplayGuard::Verdict::kStale);
    EXPECT_EQ(guard.admit(guard.now(), nonce(2)), ReplayGuard::Verdict::kFresh);
    time.wall += 3'600'000;
    EXPECT_EQ(guard.now(), time.wall) << "a clock that is set forward is followed";
}

TEST(ReplayGuard, IsBoundedAndForgetsNoneItWouldTakeAgain) {
    FakeTime time;
    ReplayGuard guard(time.clocks(), 10);
    for (unsigned char i = 0; i < 50; ++i) {
        ASSERT_EQ(guard.admit(kStart + i, nonce(i)), ReplayGuard::Verdict::kFresh);
    }
    for (unsigned char i = 0; i < 50; ++i) {
        EXPECT_NE(guard.admit(kStart + i, nonce(i)), ReplayGuard::Verdict::kFresh) << int{i};
    }
}

} // namespace
