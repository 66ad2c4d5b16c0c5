// SPDX-License-Identifier: Apache-2.0
#include "program.h"
#include "support/totp.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/totp.h>

#include <gtest/gtest.h>

#include <csignal>
#include <ctime>

namespace OvradrTest {

namespace {

using OvraPlatform::AccountStore;
using OvraPlatform::LoginResult;
using OvraPlatform::SessionStore;

constexpr const char *kPassword = "correct horse";

LoginResult logIn(const std::string &password) {
    return AccountStore().verify("bob", password, "");
}

int addBob() {
    return run({"user", "add", "bob", "--admin", "--password-stdin"}, "correct horse\nmore").exit;
}

} // namespace

TEST(User, LivesFromAddToRemove) {
    EXPECT_EQ(run({"user", "list", "--json"}).json()["data"]["users"].size(), 0U);
    ASSERT_EQ(addBob(), 0);
    EXPECT_EQ(logIn(kPassword), LoginResult::kOk);
    const Json::Value users = run({"user", "list", "--json"}).json()["data"]["users"];
    ASSERT_EQ(users.size(), 1U);
    EXPECT_EQ(users[0]["name"], "bob");
    EXPECT_TRUE(users[0]["administrator"].asBool());

    EXPECT_EQ(run({"user", "add", "bob", "--password-stdin"}, "another one").exit, 1);
    EXPECT_EQ(logIn("another one"), LoginResult::kWrong);
    ASSERT_EQ(run({"user", "passwd", "bob", "--password-stdin"}, "another one\r\n").exit, 0);
    EXPECT_EQ(logIn("another one"), LoginResult::kOk);

    ASSERT_EQ(run({"user", "disable", "bob"}).exit, 0);
    EXPECT_EQ(logIn("another one"), LoginResult::kDisabled);
    ASSERT_EQ(run({"user", "disable", "bob", "--off"}).exit, 0);
    EXPECT_EQ(logIn("another one"), LoginResult::kOk);

    ASSERT_EQ(run({"user", "remove", "bob"}).exit, 0);
    EXPECT_EQ(logIn("another one"), LoginResult::kWrong);
    for (const char *verb : {"passwd", "totp", "disable", "remove"}) {
        EXPECT_EQ(run({"user", verb, "bob"}).exit, 7) << verb;
    }
}

TEST(User, WhoIsRemovedLosesHisSessionsAndNobodyElseDoes) {
    ASSERT_EQ(addBob(), 0);
    SessionStore sessions;
    const auto his = sessions.create({.user = "bob", .app = "Tidewater", .timeout = -1});
    const auto hers = sessions.create({.user = "bobby", .app = "Tidewater", .timeout = -1});
    ASSERT_TRUE(his && hers);
    ASSERT_EQ(run({"user", "disable", "bob"}).exit, 0);
    EXPECT_TRUE(sessions.find(*his)) << "pairings live on when the account is enabled again";
    EXPECT_EQ(run({"user", "remove", "bob"}).exit, 2) << "nobody can be asked";
    const Result foreseen = run({"user", "remove", "bob", "--dry-run", "--json"});
    EXPECT_EQ(foreseen.json()["data"]["would_end_sessions"], 1);
    Terminal terminal({"user", "remove", "bob"});
    ASSERT_TRUE(terminal.answers("has 1 session, which would end", "n"));
    EXPECT_EQ(terminal.finish(), 1);
    EXPECT_TRUE(sessions.find(*his));
    const Result result = run({"user", "remove", "bob", "--yes"});
    EXPECT_EQ(result.exit, 0) << result.err;
    EXPECT_FALSE(sessions.find(*his));
    EXPECT_TRUE(sessions.find(*hers));
    EXPECT_EQ((result.out + result.err).find(*his), std::string::npos);
}

TEST(User, OneTimeCodesAreNeededOnceTheAuthenticatorHasShownARightOne) {
    ASSERT_EQ(addBob(), 0);
    for (const bool right : {false, true}) {
        Terminal terminal({"user", "totp", "bob"});
        ASSERT_TRUE(terminal.shows("secret:  ")) << terminal.screen();
        ASSERT_TRUE(terminal.shows("The code that it shows now: "));
        const std::string screen = terminal.screen();
        const std::string secret = screen.substr(screen.find("secret:  ") + 9, 32);
        for (int i = 0; i < (right ? 1 : 3); ++i) {
            terminal.type(right ? OvraTest::totp(secret, std::time(nullptr)) + "\n" : "00x\n");
        }
        EXPECT_EQ(terminal.finish(), right ? 0 : 5) << terminal.screen();
        EXPECT_EQ(logIn(kPassword), right ? LoginResult::kCodeRequired : LoginResult::kOk);
    }
}

TEST(User, TheSecretOfOneTimeCodesIsShownOnlyWhereItIsAskedFor) {
    ASSERT_EQ(addBob(), 0);
    EXPECT_EQ(run({"user", "totp", "bob"}).exit, 2) << "the output is not a terminal";
    EXPECT_EQ(logIn(kPassword), LoginResult::kOk) << "and nothing was switched on";

    const Json::Value shown = run({"user", "totp", "bob", "--show", "--json"}).json()["data"];
    EXPECT_EQ(logIn(kPassword), LoginResult::kCodeRequired);
    const std::string secret = shown["secret"].asString();
    EXPECT_EQ(OvraPlatform::normalizeTotpSecret(secret), secret);
    EXPECT_NE(shown["uri"].asString().find("secret=" + secret + "&"), std::string::npos);

    EXPECT_EQ(run({"user", "totp", "bob", "--show"}).exit, 1) << "a second one would lock bob out";
    for (const Arguments &arguments : {Arguments{"user", "list"}, {"user", "list", "--json"}}) {
        EXPECT_EQ(run(arguments).out.find(secret), std::string::npos);
    }
    ASSERT_EQ(run({"user", "totp", "bob", "--off"}).exit, 0);
    EXPECT_EQ(logIn(kPassword), LoginResult::kOk);
}

TEST(Password, IsTypedTwiceAndNotEchoed) {
    const std::pair<const char *, int> cases[] = {
        {"correct hors\n", 1}, {"corr\x03", -SIGINT}, {"correct horse\n", 0}};
    for (const auto &[again, exit] : cases) { // \x03: Ctrl-C
        Terminal terminal({"user", "add", "bob"});
        ASSERT_TRUE(terminal.shows("Password of bob: "));
        EXPECT_FALSE(terminal.echoes());
        terminal.type("correct horse\n");
        ASSERT_TRUE(terminal.shows("Again: "));
        terminal.type(again);
        EXPECT_EQ(terminal.finish(), exit) << terminal.screen();
        EXPECT_TRUE(terminal.echoes());
        EXPECT_EQ(terminal.screen().find("hors"), std::string::npos) << terminal.screen();
        EXPECT_EQ(logIn(kPassword), exit == 0 ? LoginResult::kOk : LoginResult::kWrong);
    }
}

TEST(Password, FromAFileIsItsFirstLine) {
    const std::string file = "/tmp/ovradr_test_password";
    writeFile(file, "correct horse\nnot this\n");
    const Result warned = run({"user", "add", "bob", "--password-file", file});
    EXPECT_EQ(warned.exit, 0) << warned.err;
    EXPECT_EQ(logIn(kPassword), LoginResult::kOk);
    EXPECT_NE(warned.err.find("everybody can read"), std::string::npos);
    chmod(file.c_str(), 0600);
    EXPECT_EQ(run({"user", "passwd", "bob", "--password-file", file}).err, "");
}

TEST(Password, IsRefusedWhenItCannotBeRead) {
    const std::tuple<const char *, Arguments, std::string, int> cases[] = {
        {"empty", {"--password-stdin"}, "", 1},
        {"an empty line", {"--password-stdin"}, "\ncorrect horse\n", 1},
        {"too short", {"--password-stdin"}, "short\n", 1},
        {"too long", {"--password-stdin"}, std::string(1025, 'x') + "\n", 1},
        {"not UTF-8", {"--password-stdin"}, "correct h\xf6rse\n", 1},
        {"a NUL", {"--password-stdin"}, std::string("correct \0horse\n", 15), 1},
        {"no such file", {"--password-file", "/nowhere/at/all"}, "", 1},
        {"a folder", {"--password-file", "/"}, "", 1},
        {"nobody to ask", Arguments{}, "correct horse\n", 2},
        {"two sources", {"--password-stdin", "--password-file", "/dev/null"}, "correct horse\n", 2},
        {"as an argument", {"--password", "correct horse"}, "", 2},
        {"as an argument", {"--password=correct horse"}, "", 2},
        {"as a further argument", {"correct horse"}, "", 2},
    };
    for (const auto &[what, arguments, input, exit] : cases) {
        const Result result = run(Arguments{"user", "add", "bob"} + arguments, input);
        EXPECT_EQ(result.exit, exit) << what << ": " << result.err;
        EXPECT_EQ((result.out + result.err).find("horse"), std::string::npos) << result.err;
        EXPECT_EQ(logIn(kPassword), LoginResult::kWrong) << what;
    }
}

} // namespace OvradrTest
