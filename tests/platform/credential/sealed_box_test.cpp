// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "seal/sealing.h"

#include <ovradrcore/json.h>
#include <ovraplatform/sealed_box.h>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <future>

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
    WireCall seal(const SealKeyPair &keys, const WireCall &call) {
        WireCall outer{{call.api, call.version, call.method}};
        const auto sealed = sealRequest(keys.publicKey(), call, kStart).value();
        outer.sealed = sealed.envelope;
        replyKey_ = sealed.replyKey;
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

TEST_F(SealScene, CarriesParametersAndSessionToTheOneReceiverOnce) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall());
    EXPECT_EQ(open(newKeys("other"), outer), SealVerdict::kUnreadable);
    ASSERT_EQ(open(keys, outer), SealVerdict::kOpened);
    EXPECT_EQ(opened_.call.params["passwd"], "hunter2");
    EXPECT_EQ(opened_.call.sid, "session-1");
    EXPECT_EQ(opened_.replyKey, replyKey_);
    EXPECT_EQ(open(keys, outer), SealVerdict::kReplayed);
    WireCall longer = secretCall();
    longer.params["passwd"] = "a much longer password than it";
    EXPECT_EQ(seal(keys, longer).sealed.size(), outer.sealed.size()) << "its length is shown";
}

TEST_F(SealScene, IsGoodUnchangedForItsOwnCallOnly) {
    const SealKeyPair keys = newKeys();
    const WireCall outer = seal(keys, secretCall());
    for (const APICall &other :
         {APICall{"Other", 1, "login"}, APICall{"OVRA.Core.Auth", 2, "login"},
          APICall{"OVRA.Core.Auth", 1, "logout"}}) {
        WireCall moved{other};
        moved.sealed = outer.sealed;
        EXPECT_EQ(open(keys, moved), SealVerdict::kOtherCall) << other.api << other.method;
    }
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
    ASSERT_EQ(chmod(path("key").c_str(), 0600), 0);
    for (const std::string &damaged : {std::string(), std::string("x"), text.substr(0, 30)}) {
        OvraTest::writeFile(path("key"), damaged);
        const auto kept = SealKeyPair::loadOrCreate(path("key"));
        ASSERT_FALSE(kept) << "must not be replaced";
        EXPECT_EQ(kept.error().find(text.substr(20, 10)), std::string::npos)
            << "no key in a message";
    }
}

TEST_F(SealScene, HasOneKeyWhenTwoMakeItAtOnce) {
    for (int round = 0; round < 20; ++round) {
        const std::string name = "key" + std::to_string(round);
        const auto make = [&] { return newKeys(name).publicKey(); };
        auto other = std::async(std::launch::async, make);
        EXPECT_EQ(make(), other.get());
    }
}

struct Guard : testing::Test {
    bool admits(UnixMillis stamp, unsigned char number) {
        SealNonce nonce{};
        nonce.fill(number);
        return guard.admit(stamp, nonce) == ReplayGuard::Verdict::kFresh;
    }

    FakeTime time;
    ReplayGuard guard{time.clocks(), 10};
};

TEST_F(Guard, TakesWhatIsStampedWithinItsWindowButNothingFromBeforeItsStart) {
    EXPECT_FALSE(admits(kStart - 1, 1));
    EXPECT_TRUE(admits(kStart, 1));
    time.pass(100'000);
    const UnixMillis now = guard.now();
    EXPECT_TRUE(admits(now - ReplayGuard::kMaxPast + 1, 2));
    EXPECT_FALSE(admits(now - ReplayGuard::kMaxPast, 3));
    EXPECT_TRUE(admits(now + ReplayGuard::kMaxFuture, 4));
    EXPECT_FALSE(admits(now + ReplayGuard::kMaxFuture + 1, 5));
}

TEST_F(Guard, RefusesARepetitionAsLongAsItIsFreshAndAfterwards) {
    const UnixMillis stamp = kStart + ReplayGuard::kMaxFuture;
    ASSERT_TRUE(admits(stamp, 1));
    for (int i = 0; i < 100; ++i) {
        time.pass(1000);
        EXPECT_FALSE(admits(stamp, 1)) << i;
    }
    time.wall -= 200'000;
    EXPECT_FALSE(admits(stamp, 1)) << "the clock was set back";
    EXPECT_TRUE(admits(guard.now(), 2));
    time.wall += 3'600'000;
    EXPECT_EQ(guard.now(), time.wall) << "a clock that is set forward is followed";
}

TEST_F(Guard, IsBoundedAndForgetsNoneItWouldTakeAgain) {
    for (const bool first : {true, false}) {
        for (unsigned char i = 0; i < 50; ++i) {
            EXPECT_EQ(admits(kStart + i, i), first) << int{i};
        }
    }
}

} // namespace
