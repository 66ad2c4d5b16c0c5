// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "support/log_capture.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/totp.h>

#include <array>
#include <chrono>
#include <future>
#include <thread>

namespace {

using OvraPlatform::AccountStore;
using OvraTest::Appliance;
using OvraTest::Reply;

class Login : public Appliance {};

TEST_F(Login, GivesASessionOfHalfAnHourThatWorksUntilLogout) {
    addAccount("alice", true);
    const Reply granted = login("alice", kPassword);
    ASSERT_EQ(granted.code(), 0) << granted.text;
    const std::string sid = granted.data()["sid"].asString();
    const auto record = OvraPlatform::SessionStore().find(sid);
    ASSERT_TRUE(record);
    EXPECT_EQ(record->user, "alice");
    EXPECT_EQ(record->app, "ovradrd");
    EXPECT_EQ(record->remote, "127.0.0.1");
    EXPECT_EQ(record->expires.value_or(0) - record->created, 1800);

    EXPECT_EQ(call("OVRA.DR.Node", 1, "test_privilege", {}, sid).code(), 0);
    EXPECT_EQ(call("OVRA.Core.Auth", 1, "logout", {}, sid).code(), 0);
    EXPECT_EQ(call("OVRA.DR.Node", 1, "test_privilege", {}, sid).code(), 119);
    EXPECT_EQ(call("OVRA.Core.Auth", 1, "logout", {}, sid).code(), 119);
}

TEST_F(Login, TellsWhyItRefusesOnlyToWhoKnowsThePassword) {
    for (const char *name : {"plain", "disabled", "local", "coded"}) {
        addAccount(name, false);
    }
    AccountStore accounts;
    ASSERT_TRUE(accounts.setDisabled("disabled", true));
    ASSERT_TRUE(accounts.setRemoteLogin("local", false));
    ASSERT_TRUE(accounts.setTotp("coded", OvraPlatform::newTotpSecret()));

    EXPECT_EQ(login("nobody", kPassword).code(), 400);
    EXPECT_EQ(login("plain", "wrong password").code(), 400);
    EXPECT_EQ(login("disabled", "wrong password").code(), 400);
    EXPECT_EQ(login("disabled", kPassword).code(), 401);
    restart({}); // resets the throttle
    EXPECT_EQ(login("local", kPassword).code(), 402);
    EXPECT_EQ(login("coded", kPassword).code(), 403);
    EXPECT_EQ(login("coded", kPassword, "000000").code(), 404);
}

TEST_F(Login, RefusesParametersThatAreNoLogIn) {
    for (const char *params :
         {R"({})", R"({"account":"a"})", R"({"account":7,"passwd":"x"})",
          R"({"account":"a","passwd":"x","otp_code":7})", R"({"account":"a\n","passwd":"x"})"}) {
        EXPECT_EQ(call("OVRA.Core.Auth", 1, "login", OvraTest::json(params)).code(), 106) << params;
    }
    Json::Value huge = OvraTest::json(R"({"passwd":"x"})");
    huge["account"] = std::string(500'000, 'a');
    EXPECT_EQ(call("OVRA.Core.Auth", 1, "login", huge).code(), 106);
}

TEST_F(Login, SlowsGuessesDownWhileOthersAreServed) {
    addAccount("alice", false);
    const std::string sid = session("alice");
    std::chrono::steady_clock::time_point begun;
    for (int i = 0; i < 5; ++i) {
        begun = std::chrono::steady_clock::now();
        EXPECT_EQ(login("alice", "wrong password").code(), 400);
    }
    // As many as the server has threads per port. They begin 1 s and 3 s after the last one began.
    std::array<std::future<Reply>, 2> guesses;
    for (auto &guess : guesses) {
        guess = std::async(std::launch::async, [this] { return login("alice", "wrong password"); });
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    EXPECT_EQ(call("OVRA.DR.Node", 1, "info", {}, sid).code(), 0);
    for (auto &guess : guesses) {
        EXPECT_EQ(guess.wait_for(std::chrono::seconds(0)), std::future_status::timeout)
            << "a guess was answered before somebody else's request";
    }
    for (auto &guess : guesses) {
        EXPECT_EQ(guess.get().code(), 400);
    }
    EXPECT_GE(std::chrono::steady_clock::now() - begun, std::chrono::seconds(3));
}

TEST_F(Login, WritesNoSecretToTheLog) {
    const LogCapture log;
    addAccount("alice", false);
    EXPECT_TRUE(AccountStore().setTotp("alice", OvraPlatform::newTotpSecret()));
    login("alice", kPassword, "135790");
    login("alice", "another password");
    login("my password\ttyped here", "x");
    EXPECT_TRUE(AccountStore().clearTotp("alice"));
    const Reply granted = login("alice", kPassword);
    ASSERT_EQ(granted.code(), 0);
    for (const std::string &secret :
         {std::string(kPassword), std::string("135790"), std::string("another password"),
          std::string("typed here"), granted.data()["sid"].asString()}) {
        EXPECT_EQ(log.count(secret), 0) << secret;
    }
    EXPECT_EQ(log.count("[alice] logged in from [127.0.0.1]"), 1);
}

} // namespace
