// SPDX-License-Identifier: Apache-2.0
// The program against a node with scripted answers.
#include "program.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <gtest/gtest.h>

#include <chrono>
#include <thread>

namespace OvradrTest {

namespace {

using OvraTest::querySql;
using OvraTest::RemoteNode;

constexpr const char *kSession = "granted-session-0123456789";

class Pairing : public testing::Test {
protected:
    Pairing() {
        EXPECT_EQ(run({"setup"}).exit, 0);
        remote.answer("login", R"({"success":true,"data":{"sid":"login-session"}})");
        remote.answer("info", R"({"success":true,"data":{"node_id":"remote-node","serial":"S1"}})");
        remote.answer("create",
                      R"({"success":true,"data":{"session":")" + std::string(kSession) + R"("}})");
        remote.answer("temp_create", R"({"success":true,"data":{"session":"short-lived"}})");
    }

    std::string url() const { return "https://127.0.0.1:" + std::to_string(remote.port()); }

    Arguments create(const Arguments &more) const {
        Arguments arguments{"cred", "create", url(), "--account", "bob"};
        arguments.insert(arguments.end(), more.begin(), more.end());
        return arguments;
    }

    /// Pairs, and fails the test if that does not work.
    Result pair(const Arguments &more = {}) const {
        Arguments arguments =
            create({"--password-stdin", "--json", "--fingerprint", remote.server.fingerprint()});
        arguments.insert(arguments.end(), more.begin(), more.end());
        Result result = run(arguments, "secret word\n");
        EXPECT_EQ(result.exit, 0) << result.out << result.err;
        return result;
    }

    static std::string credentials() { return querySql("SELECT node_id, port FROM node_cred"); }

    RemoteNode remote;
};

} // namespace

TEST_F(Pairing, StoresACredentialAndShowsNothingSecretOfIt) {
    const Json::Value made = pair({"--otp", "123456"}).json()["data"];
    EXPECT_EQ(made["node_id"], "remote-node");
    EXPECT_EQ(credentials(), "remote-node|" + std::to_string(remote.port()) + "\n");
    EXPECT_NE(remote.params("login").find(R"("otp_code":"123456")"), std::string::npos);

    const std::string id = made["cred_id"].asString();
    for (const Arguments &arguments : {Arguments{"cred", "list"},
                                       {"cred", "list", "--json", "--node", "remote"},
                                       {"cred", "show", id.substr(0, 8)},
                                       {"cred", "show", id, "--json"}}) {
        const Result result = run(arguments);
        EXPECT_EQ(result.exit, 0) << result.err;
        EXPECT_NE(result.out.find(id), std::string::npos) << result.out;
        EXPECT_EQ(result.out.find(kSession), std::string::npos) << result.out;
    }
}

TEST_F(Pairing, ATemporaryCredentialIsListedOnRequest) {
    const std::string id = pair({"--temp"}).json()["data"]["cred_id"].asString();
    EXPECT_EQ(credentials(), "");
    EXPECT_EQ(run({"cred", "list"}).out.find(id), std::string::npos);
    EXPECT_NE(run({"cred", "list", "--temp"}).out.find(id), std::string::npos);
    EXPECT_TRUE(run({"cred", "show", id, "--json"}).json()["data"]["temporary"].asBool());
}

TEST_F(Pairing, NothingIsSentToAKeyThatNobodyTrusts) {
    std::string other = remote.server.fingerprint();
    char &digit =
        other[std::string("SHA256:").size()]; // the last one holds two bits that must be 0
    digit = digit == 'A' ? 'B' : 'A';
    for (const Arguments &more :
         {Arguments{"--password-stdin"}, {"--password-stdin", "--fingerprint", other}}) {
        const Result result = run(create(more), "y\n");
        EXPECT_EQ(result.exit, 6) << result.err;
        EXPECT_NE(result.err.find(remote.server.fingerprint()), std::string::npos) << result.err;
    }
    EXPECT_EQ(remote.calls(), "");
    EXPECT_EQ(run({"conn", "forget", url()}).exit, 7) << "and nothing was pinned";
}

TEST_F(Pairing, AKeyThatChangedIsRefusedUntilTheOldOneIsForgotten) {
    pair();
    remote.server.changeCertificate();
    remote.server.closeConnections();
    remote.forgetCalls();
    const Arguments again =
        create({"--password-stdin", "--fingerprint", remote.server.fingerprint()});
    const Result refused = run(again, "secret word\n");
    EXPECT_EQ(refused.exit, 6) << refused.err;
    EXPECT_EQ(remote.calls(), "");
    EXPECT_EQ(run({"conn", "test", url(), "--json"}).json()["data"]["trust"], "changed");
    EXPECT_EQ(run({"conn", "forget", url()}).exit, 0);
    EXPECT_EQ(run(again, "secret word\n").exit, 0);
}

TEST_F(Pairing, AtATerminalTheKeyThePasswordAndTheCodeAreAskedFor) {
    remote.answer("login", R"({"success":false,"error":{"code":403}})");
    Terminal terminal(create({}));
    ASSERT_TRUE(terminal.shows(remote.server.fingerprint())) << terminal.screen();
    ASSERT_TRUE(terminal.shows("Trust this key? [y/N]"));
    terminal.type("y\n");
    ASSERT_TRUE(terminal.shows("Password of bob on 127.0.0.1: ")) << terminal.screen();
    terminal.type("secret word\n");
    ASSERT_TRUE(terminal.shows("One-time code: ")) << terminal.screen();
    remote.answer("login", R"({"success":true,"data":{"sid":"login-session"}})");
    terminal.type("654321\n");
    EXPECT_EQ(terminal.finish(), 0) << terminal.screen();
    EXPECT_EQ(terminal.screen().find("secret"), std::string::npos);
    EXPECT_EQ(terminal.screen().find("654321"), std::string::npos);
    EXPECT_NE(remote.params("login").find(R"("otp_code":"654321")"), std::string::npos);
    EXPECT_EQ(credentials(), "remote-node|" + std::to_string(remote.port()) + "\n");
}

TEST_F(Pairing, AKeyThatThePersonDoesNotTrustIsNotKept) {
    Terminal terminal(create({}));
    ASSERT_TRUE(terminal.shows("Trust this key? [y/N]"));
    terminal.type("\n");
    EXPECT_EQ(terminal.finish(), 6);
    EXPECT_EQ(run({"conn", "test", url(), "--json"}).json()["data"]["trust"], "unknown");
}

TEST_F(Pairing, EachRefusalHasItsExitCode) {
    const struct {
        const char *call;
        const char *answer;
        int exit;
        int code;
    } cases[] = {
        {"login", R"({"success":false,"error":{"code":400}})", 4, 501},
        {"login", R"({"success":false,"error":{"code":401}})", 4, 502},
        {"login", R"({"success":false,"error":{"code":402}})", 4, 503},
        {"login", R"({"success":false,"error":{"code":403}})", 5, 504},
        {"login", R"({"success":false,"error":{"code":404}})", 5, 505},
        {"info", R"({"success":false,"error":{"code":105}})", 8, 525},
        {"info", R"({"success":true,"data":{"node_id":"x"}})", 1, 519},
        {"create", R"({"success":false,"error":{"code":105}})", 1, 509},
    };
    RemoteNode refusing; // one for all: the port of another could be one whose key is known already
    for (const auto &each : cases) {
        refusing.answer("login", R"({"success":true,"data":{"sid":"login-session"}})");
        refusing.answer("info", R"({"success":true,"data":{"node_id":"n","serial":"S"}})");
        refusing.answer(each.call, std::string(each.answer));
        const Result result =
            run({"cred", "create", "https://127.0.0.1:" + std::to_string(refusing.port()), "--json",
                 "--account", "bob", "--password-stdin", "--fingerprint",
                 refusing.server.fingerprint()},
                "secret word\n");
        EXPECT_EQ(result.exit, each.exit) << each.answer << result.out;
        EXPECT_EQ(result.json()["error"]["code"], each.code) << each.answer;
        EXPECT_EQ((result.out + result.err).find("secret word"), std::string::npos);
        EXPECT_EQ((result.out + result.err).find("login-session"), std::string::npos);
    }
    EXPECT_EQ(credentials(), "");
}

TEST_F(Pairing, TheOneTimeCodeCannotBeSeenByOtherProcesses) {
    remote.server.fallSilent();
    for (const Arguments &code : {Arguments{"--otp", "731946"}, {"--otp=731946"}}) {
        Arguments arguments = create({"--password-stdin"});
        arguments.insert(arguments.end(), code.begin(), code.end());
        Program program(arguments, "secret word\n");
        const std::string proc = "/proc/" + std::to_string(program.pid());
        // It waits for the silent server; shortly after its start the code must be gone.
        std::string seen;
        for (int i = 0; i < 500 && seen.find("******") == std::string::npos; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
            seen = readFile(proc + "/cmdline");
        }
        EXPECT_NE(seen.find("******"), std::string::npos);
        for (const std::string &text : {seen, readFile(proc + "/environ")}) {
            EXPECT_EQ(text.find("731946"), std::string::npos);
            EXPECT_EQ(text.find("secret word"), std::string::npos);
        }
    }
}

TEST_F(Pairing, ACallTakesParametersAsTheyAreMeant) {
    pair();
    const Result result = run({"call", "remote", "OVRA.DR.Node", "echo", "--param", "number=7",
                               "--param", "text=seven=7", "--param", R"(list=["a",1])", "--param",
                               R"(quoted:="7")", "--params-file", "-"},
                              R"({"more":{"x":null}})");
    EXPECT_EQ(result.exit, 0) << result.err;
    EXPECT_EQ(remote.params("echo"),
              R"({"list":["a",1],"more":{"x":null},"number":7,"quoted":"7","text":"seven=7"})");
}

TEST_F(Pairing, WhatANodeAnswersIsShownHarmless) {
    pair();
    remote.answer("show",
                  R"({"success":true,"data":{"name":"\u001b[2Jn\u00e4s","session":"s3cret"}})");
    remote.answer("refuse", R"({"success":false,"error":{"code":105,"msg":"\u001b[2Jno"}})");
    for (const char *format : {"", "--json"}) {
        Arguments show{"call", "remote", "OVRA.DR.Node", "show"};
        Arguments refuse{"call", "remote", "OVRA.DR.Node", "refuse"};
        for (Arguments *arguments : {&show, &refuse}) {
            if (*format != '\0') {
                arguments->emplace_back(format);
            }
        }
        const Result shown = run(show);
        const Result refused = run(refuse);
        EXPECT_EQ(shown.exit, 0) << shown.err;
        EXPECT_EQ(refused.exit, 8) << refused.err;
        const std::string all = shown.out + shown.err + refused.out + refused.err;
        EXPECT_EQ(all.find('\x1B'), std::string::npos) << all;
        EXPECT_EQ(all.find("s3cret"), std::string::npos) << all;
        EXPECT_NE(shown.out.find("[2Jn"), std::string::npos) << "the name itself is there";
    }
}

TEST_F(Pairing, ANodeIsFoundByTheBeginningOfItsId) {
    OvraTest::addCred("node_cred", "aa-1", "c-1", "https", remote.port(), "s");
    OvraTest::addCred("temp_cred", "aa-2", "c-2", "https", remote.port(), "s");
    const struct {
        Arguments arguments;
        int exit;
    } cases[] = {
        {{"call", "aa-", "A", "m"}, 2},
        {{"call", "bb", "A", "m"}, 7},
        {{"call", "", "A", "m"}, 7},
        {{"call", "aa-1", "A", "m", "--cred", "c-2"}, 1},
        {{"call", "aa-1", "A", "m", "--cred", "c-9"}, 7},
        {{"cred", "show", "c-"}, 2},
        {{"cred", "show", "c-3"}, 7},
        {{"cred", "show", "c-2"}, 0},
        {{"cred", "list", "--node", "aa-2"}, 0},
    };
    for (const auto &each : cases) {
        EXPECT_EQ(run(each.arguments).exit, each.exit) << each.arguments[1] << each.arguments[2];
    }
}

TEST_F(Pairing, WhatTheNodeSaysAboutARefusalIsTheAdvice) {
    OvraTest::addCred("node_cred", "remote-node", "c-1", "https", remote.port(), "s");
    remote.answer("test_privilege", R"({"success":false,"error":{"code":105,"msg":)"
                                    R"("the account is disabled: enable it"}})");
    for (const Arguments &command : {Arguments{"cred", "test", "c-1"}, {"doctor", "remote-node"}}) {
        const Result refused = run(command);
        EXPECT_EQ(refused.exit, 8) << refused.out << refused.err;
        EXPECT_NE(refused.err.find("the account is disabled"), std::string::npos) << refused.err;
        EXPECT_NE(refused.err.find("Enable it."), std::string::npos) << refused.err;
    }
}

TEST_F(Pairing, AnEndpointIsTested) {
    const Json::Value open = run({"conn", "test", url(), "--json"}).json()["data"];
    EXPECT_TRUE(open["connectable"].asBool());
    EXPECT_EQ(open["fingerprint"], remote.server.fingerprint());
    EXPECT_EQ(open["trust"], "unknown");
    pair();
    EXPECT_EQ(run({"conn", "test", url(), "--json"}).json()["data"]["trust"], "pinned");
    const Result plain = run({"conn", "test", "http://127.0.0.1:" + std::to_string(remote.port())});
    EXPECT_EQ(plain.exit, 3) << "HTTP to a TLS port: " << plain.out << plain.err;
    remote.server.refuse();
    const Result closed = run({"conn", "test", url()});
    EXPECT_EQ(closed.exit, 3);
    EXPECT_NE(closed.err.find("cannot connect"), std::string::npos) << closed.err;
}

} // namespace OvradrTest
