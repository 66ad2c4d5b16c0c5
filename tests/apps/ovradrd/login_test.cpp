// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "handlers/auth.h"
#include "support/log_capture.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/totp.h>

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
    EXPECT_EQ(call("OVRA.Core.Auth", 1, "login", huge).code(), 108);
}

TEST_F(Login, RefusesFurtherGuessesAlsoAfterARestartButNoLogInThatIsRight) {
    addAccount("alice", false);
    for (int i = 0; i < 12; ++i) {
        ASSERT_EQ(login("alice", kPassword).code(), 0) << i;
    }
    const auto guess = [this] { return login("alice", "wrong password").code(); };
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(guess(), 400) << i;
    }
    EXPECT_EQ(guess(), 107);
    EXPECT_EQ(call("OVRA.DR.Node", 1, "info", {}, session("alice")).code(), 0);
    restart({});
    EXPECT_EQ(guess(), 107);
}

TEST_F(Login, LetsInWhoLoggedInBeforeWhileStrangersGuess) {
    addAccount("alice", false);
    static constexpr char kRelay[] = "192.0.2.99";
    const auto loginFrom = [](const char *address, const char *password, const char *device) {
        Ovradrd::LoginApi api; // a new one, as after a restart
        OvraPlatform::APIRegistry registry;
        api.addTo(registry);
        api.noteRelay(kRelay);
        OvraPlatform::APICaller caller;
        caller.address = address;
        Json::Value params = OvraTest::json(R"({"account":"alice"})");
        params["passwd"] = password;
        params["device_token"] = device;
        return registry.dispatch({"OVRA.Core.Auth", 1, "login", params}, caller)["error"]["code"]
            .asInt();
    };
    EXPECT_EQ(loginFrom("192.0.2.1", kPassword, ""), 0);
    EXPECT_EQ(loginFrom(kRelay, kPassword, "token"), 0);
    for (const char *stranger : {"198.51.100.1", "198.51.100.2"}) {
        for (int i = 0; i < 10; ++i) {
            EXPECT_EQ(loginFrom(stranger, "wrong password", ""), 400);
        }
    }
    const struct {
        const char *address;
        const char *device;
        int code;
    } rows[] = {{"192.0.2.1", "", 0},     {"192.0.2.2", "", 107},    {kRelay, "", 107},
                {kRelay, "token", 0},     {"192.0.2.2", "token", 0}, {kRelay, "other", 107},
                {"198.51.100.1", "", 107}};
    for (const auto &row : rows) {
        EXPECT_EQ(loginFrom(row.address, kPassword, row.device), row.code)
            << row.address << " " << row.device;
    }
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
