// SPDX-License-Identifier: Apache-2.0
// The program against a node with scripted answers.
#include "scripted_node.h"
#include "shared/pending_releases.h"

#include <ovraplatform/appliance.h>

#include <chrono>
#include <thread>

namespace OvradrTest {

namespace {

using OvraTest::addCred;
using OvraTest::querySql;

class Pairing : public ScriptedNode {
protected:
    /// Pairs, and fails the test if that does not work. \return the data
    Json::Value pair(const Arguments &more = {}) const {
        const Result result = logIn(remote, create + Arguments{"--json"} + more);
        EXPECT_EQ(result.exit, 0) << result.out << result.err;
        return result.json()["data"];
    }
    Json::Value tested() const { return run({"conn", "test", url, "--json"}).json()["data"]; }

    static std::string credentials() { return querySql("SELECT node_id, port FROM node_cred"); }

    const Arguments create{"cred", "create", url};
    const std::string paired = "n1|" + std::to_string(remote.port()) + "\n";
};

} // namespace

TEST_F(Pairing, StoresACredentialAndShowsNothingSecretOfIt) {
    const std::string temporary = pair({"--temp"})["cred_id"].asString();
    const std::string id = pair({"--otp", " 123 456\n"})["cred_id"].asString();
    EXPECT_NE(remote.params("login").find(R"("otp_code":"123456")"), std::string::npos);
    EXPECT_EQ(credentials(), paired);
    EXPECT_TRUE(run({"cred", "show", temporary, "--json"}).json()["data"]["temporary"].asBool());
    for (const Arguments &arguments : {Arguments{"cred", "list", "--temp"},
                                       {"cred", "list"},
                                       {"cred", "show", id.substr(0, 8)},
                                       {"cred", "list", "--json", "--node", "n"},
                                       {"cred", "show", id, "--json"},
                                       {"why", "n1", "--json"}}) {
        const Result result = run(arguments);
        EXPECT_EQ(result.exit, 0) << result.err;
        const bool table = arguments[1] == "list" && result.out.front() != '{';
        EXPECT_EQ(result.out.find(id) == std::string::npos, table) << "short in a table";
        EXPECT_NE(result.out.find(id.substr(0, 8)), std::string::npos) << result.out;
        EXPECT_NE(result.out.find(url), std::string::npos) << result.out;
        EXPECT_EQ(result.out.find(R"("addr")"), std::string::npos) << "one form of an endpoint";
        EXPECT_EQ(result.out.find("s3cret"), std::string::npos) << result.out;
        EXPECT_EQ(result.out.find(temporary.substr(0, 8)) != std::string::npos,
                  arguments.back() == "--temp" || arguments[0] == "why");
    }
    EXPECT_NE(run({"cred", "list", "--wide"}).out.find(id), std::string::npos);
    EXPECT_NE(
        run({"cred", "list", "--node", "local"}).out.find("no lasting credential for the node"),
        std::string::npos);
}

TEST_F(Pairing, NothingSecretIsSentToAKeyThatNobodyTrusts) {
    std::string other = remote.server.fingerprint();
    char &digit =
        other[std::string("SHA256:").size()]; // the last one holds two bits that must be 0
    digit = digit == 'A' ? 'B' : 'A';
    const Arguments doctor{"doctor", url};
    for (const Arguments &command : {create, create + Arguments{"--fingerprint", other}, doctor}) {
        const Result result =
            run(command + Arguments{"--account", "bob", "--password-stdin"}, "y\n");
        EXPECT_EQ(result.exit, 6) << result.err;
        EXPECT_NE((result.err + result.out).find(remote.server.fingerprint()), std::string::npos);
        EXPECT_EQ(remote.calls().find("login"), std::string::npos);
        EXPECT_TRUE(command == doctor || remote.calls().empty()) << remote.calls();
    }
    EXPECT_EQ(run(doctor).exit, 0) << "what sends no secret needs no trust";
    EXPECT_EQ(run({"conn", "forget", url}).exit, 7) << "and nothing was pinned";
}

TEST_F(Pairing, AKeyThatChangedOrWasForgottenOrLostIsRefusedUntilAPersonTrustsIt) {
    const std::string credId = pair()["cred_id"].asString();
    const std::string old = remote.server.fingerprint();
    remote.server.changeCertificate();
    const Arguments trust{"conn", "trust", url};
    const Arguments named = trust + Arguments{"--fingerprint", remote.server.fingerprint()};
    const Arguments forget{"conn", "forget", url};
    remote.server.closeConnections();
    remote.forgetCalls();
    EXPECT_EQ(logIn(remote, create).exit, 6);
    EXPECT_EQ(remote.calls(), "");
    EXPECT_EQ(tested()["trust"], "changed");
    EXPECT_EQ(run(trust).exit, 6) << "nobody can be asked";
    EXPECT_EQ(run(trust + Arguments{"--fingerprint", old}).exit, 6) << "it shows another one";
    Terminal terminal(trust);
    ASSERT_TRUE(terminal.shows(old) && terminal.shows(remote.server.fingerprint()));
    ASSERT_TRUE(terminal.answers("Is it the same? [y/N]", "y"));
    EXPECT_EQ(terminal.finish(), 0);
    EXPECT_EQ(tested()["trust"], "pinned");

    EXPECT_EQ(run(forget).exit, 0);
    EXPECT_EQ(run(forget).exit, 7);
    EXPECT_EQ(tested()["trust"], "forgotten");
    remote.forgetCalls();
    EXPECT_EQ(run({"call", "n1", "OVRA.DR.Node", "info"}).exit, 6);
    EXPECT_EQ(run({"doctor", "n1"}).exit, 6);
    const Result distrusted = run({"cred", "test", credId});
    EXPECT_NE(distrusted.err.find("`ovradr conn trust " + url + "`"), std::string::npos)
        << distrusted.err;
    EXPECT_EQ(remote.calls().find("s3cret"), std::string::npos) << remote.calls();
    EXPECT_EQ(run(named + Arguments{"--json"}).json()["data"]["before"], "forgotten");
    EXPECT_EQ(logIn(remote, create).exit, 0);

    std::filesystem::remove(OvraPlatform::kKnownEndpointsFile);
    EXPECT_EQ(run({"setup"}).exit, 0);
    EXPECT_EQ(tested()["trust"], "lost") << "set-up makes no new one for a node with credentials";
    EXPECT_EQ(run({"doctor"}).exit, 9);
    EXPECT_EQ(run({"doctor", url}).exit, 6);
    OvraTest::executeSql("ALTER TABLE node_cred RENAME TO away");
    EXPECT_EQ(run({"setup"}).exit, 9) << "it may have credentials";
    EXPECT_EQ(tested()["trust"], "lost");
    OvraTest::executeSql("ALTER TABLE away RENAME TO node_cred");
    OvraTest::addCred("node_cred", "n2", "c2", "https", 5001, "s2");
    EXPECT_EQ(run(named).exit, 0);
    EXPECT_EQ(run({"call", "n1", "OVRA.DR.Node", "info"}).exit, 0);
    EXPECT_EQ(run({"doctor"}).exit, 9) << "the key of the other credential is still lost";
    EXPECT_EQ(run({"conn", "trust", "https://127.0.0.1", "--fingerprint", old}).exit, 0);
    EXPECT_EQ(readFile(OvraPlatform::kKnownEndpointsFile).find("lost"), std::string::npos);
    // An alias is known by its name, whether or not it is reached now.
    EXPECT_EQ(run({"conn", "trust", "flk:nas3", "--fingerprint", old}).exit, 0);
    EXPECT_EQ(run({"conn", "forget", "flk:NAS3"}).exit, 0);
}

TEST_F(Pairing, AtATerminalTheKeyThePasswordAndTheCodeAreAskedFor) {
    const Arguments command = create + Arguments{"--account", "bob"};
    Terminal distrustful(command);
    ASSERT_TRUE(distrustful.answers("Is it the same? [y/N]", ""));
    EXPECT_EQ(distrustful.finish(), 6);
    EXPECT_EQ(tested()["trust"], "unknown");

    remote.answer("login", R"({"success":false,"error":{"code":107,"msg":"full: try in 9 s"}})");
    const Result throttled = logIn(remote, create);
    EXPECT_NE(throttled.err.find("Try in 9 s."), std::string::npos) << throttled.err;
    EXPECT_EQ(run({"conn", "forget", url}).exit, 0);

    remote.answer("login", refusal(403));
    Terminal terminal(command);
    ASSERT_TRUE(terminal.shows(remote.server.fingerprint())) << terminal.screen();
    ASSERT_TRUE(terminal.answers("Is it the same? [y/N]", "y"));
    ASSERT_TRUE(terminal.answers("Password of bob on 127.0.0.1: ", "secret word"));
    ASSERT_TRUE(terminal.shows("One-time code: ")) << terminal.screen();
    remote.answer("login", success(R"({"sid":"login-s3cret"})"));
    terminal.type("654321\n");
    EXPECT_EQ(terminal.finish(), 0) << terminal.screen();
    EXPECT_EQ(terminal.screen().find("secret"), std::string::npos);
    EXPECT_EQ(terminal.screen().find("654321"), std::string::npos);
    EXPECT_NE(remote.params("login").find(R"("otp_code":"654321")"), std::string::npos);
    EXPECT_EQ(credentials(), paired);
}

TEST_F(Pairing, EachRefusalHasItsExitCode) {
    const std::tuple<const char *, std::string, int, int> cases[] = {
        {"login", refusal(400), 4, 501},
        {"login", refusal(401), 4, 502},
        {"login", refusal(402), 4, 503},
        {"login", refusal(403), 5, 504},
        {"login", refusal(404), 5, 505},
        {"info", refusal(105), 8, 525},
        {"info", success(R"({"node_id":"x"})"), 1, 519},
        {"create", refusal(105), 8, 105},
        {"create", success("{}"), 1, 509},
    };
    for (const auto &[call, answer, exit, code] : cases) {
        admitBob(remote);
        remote.answer(call, answer);
        const Result result = logIn(remote, create + Arguments{"--json"});
        EXPECT_EQ(result.exit, exit) << answer << result.out;
        EXPECT_EQ(result.json()["error"]["code"], code) << answer;
        EXPECT_EQ((result.out + result.err).find("secret word"), std::string::npos);
        EXPECT_EQ((result.out + result.err).find("s3cret"), std::string::npos);
    }
    EXPECT_EQ(credentials(), "");
}

TEST_F(Pairing, TheOneTimeCodeCannotBeSeenByOtherProcesses) {
    remote.server.fallSilent();
    for (const Arguments &code : {Arguments{"--otp", "731946"}, {"--otp=731946"}}) {
        Program program(asBob(remote, create + code), "secret word\n");
        const std::string proc = "/proc/" + std::to_string(program.pid());
        // It waits for the silent server; shortly after its start the code must be gone.
        std::string seen;
        for (int i = 0; i < 500 && seen.find("******") == std::string::npos; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
            seen = readFile(proc + "/cmdline");
        }
        EXPECT_NE(seen.find("******"), std::string::npos);
        seen += readFile(proc + "/environ");
        EXPECT_EQ(seen.find("731946"), std::string::npos);
        EXPECT_EQ(seen.find("secret word"), std::string::npos);
    }
}

TEST_F(Pairing, ACallTakesParametersAsTheyAreMeant) {
    pair();
    const Result result =
        run({"call", "n1", "OVRA.DR.Node", "echo", "--param", "number=7", "--param", "text=seven=7",
             "--param", R"(list=["a",1])", "--param", R"(quoted:="7")", "--params-file", "-"},
            R"({"more":{"x":null}})");
    EXPECT_EQ(result.exit, 0) << result.err;
    EXPECT_EQ(remote.params("echo"),
              R"({"list":["a",1],"more":{"x":null},"number":7,"quoted":"7","text":"seven=7"})");
}

TEST_F(Pairing, WhatANodeAnswersIsShownHarmless) {
    pair();
    remote.answer("show", success(R"({"name":"\u001b[2Jn\u00e4s","session":"s3cret"})"));
    remote.answer("refuse", R"({"success":false,"error":{"code":105,"msg":"\u001b[2Jno"}})");
    for (const Arguments &format : {Arguments{}, {"--json"}}) {
        const Result shown = run(Arguments{"call", "n1", "OVRA.DR.Node", "show"} + format);
        const Result refused = run(Arguments{"call", "n1", "OVRA.DR.Node", "refuse"} + format);
        EXPECT_EQ(shown.exit, 0) << shown.err;
        EXPECT_EQ(refused.exit, 8) << refused.err;
        const std::string all = shown.out + shown.err + refused.out + refused.err;
        EXPECT_EQ(all.find('\x1B'), std::string::npos) << all;
        EXPECT_EQ(all.find("s3cret"), std::string::npos) << all;
        EXPECT_NE(shown.out.find("[2Jn"), std::string::npos) << "the name itself is there";
    }
}

TEST_F(Pairing, ANodeIsFoundByTheBeginningOfItsId) {
    addCred("node_cred", "aa-1", "c-1", "https", remote.port(), "s");
    addCred("temp_cred", "aa-2", "c-2", "https", remote.port(), "s");
    const std::pair<Arguments, int> cases[] = {
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
    for (const auto &[arguments, exit] : cases) {
        EXPECT_EQ(run(arguments).exit, exit) << testing::PrintToString(arguments);
    }
}

TEST_F(Pairing, WhatTheNodeSaysAboutARefusalIsTheAdvice) {
    remote.trust();
    addCred("node_cred", "n1", "c-1", "https", remote.port(), "s");
    remote.answer("test_privilege", R"({"success":false,"error":{"code":105,"msg":)"
                                    R"("the account is disabled: enable it"}})");
    for (const Arguments &command : {Arguments{"cred", "test", "c-1"}, {"doctor", "n1"}}) {
        const Result refused = run(command);
        EXPECT_EQ(refused.exit, 8) << refused.out << refused.err;
        EXPECT_NE(refused.err.find("the account is disabled"), std::string::npos) << refused.err;
        EXPECT_NE(refused.err.find("Enable it."), std::string::npos) << refused.err;
    }
}

TEST_F(Pairing, AnEndpointIsTested) {
    const Json::Value open = tested();
    EXPECT_TRUE(open["connectable"].asBool());
    EXPECT_EQ(open["fingerprint"], remote.server.fingerprint());
    EXPECT_EQ(open["trust"], "unknown");
    pair();
    EXPECT_EQ(tested()["trust"], "pinned");
    const OvraTest::MisbehavingServer plain;
    remote.server.refuse();
    const std::pair<std::string, const char *> cases[] = {
        {"https://no-such-host.invalid", "is not known"},
        {url, "refuses connections"},
        {"https://127.0.0.1:" + std::to_string(plain.port()), "does not speak HTTPS"},
    };
    for (const auto &[target, why] : cases) {
        for (const Arguments &command :
             {Arguments{"conn", "test", target}, {"conn", "trust", target}, create}) {
            const Result failed =
                command == create ? logIn(remote, {"cred", "create", target}) : run(command);
            EXPECT_EQ(failed.exit, 3) << failed.err;
            EXPECT_NE(failed.err.find(why), std::string::npos) << failed.err;
            EXPECT_NE(failed.err.find("ovradr doctor http"), std::string::npos) << failed.err;
        }
    }
    const Result called = run({"call", "n1", "A", "m", "--json"});
    EXPECT_EQ(called.exit, 3);
    EXPECT_EQ(called.json()["error"]["code"], 500);
    EXPECT_NE(called.out.find("ovradr doctor"), std::string::npos) << called.out;
}

TEST_F(Pairing, WhatIsAskedNowIsAskedWhateverWasFoundBefore) {
    const std::string id = pair()["cred_id"].asString();
    remote.answer("s test_privilege", refusal(119)); // has ended
    ASSERT_TRUE(OvraApps::PendingReleases().note(
        {"s", OvraDRNode::Conn::https("127.0.0.1", remote.port()), "n1", "c0"}));
    for (const Arguments &command : {Arguments{"cred", "test", id},
                                     {"node", "info", "n1", "--refresh"},
                                     {"session", "pending", "--retry"}}) {
        remote.server.answerOnce(OvraTest::Answer::status(500));
        EXPECT_EQ(run({"conn", "test", url}).exit, 3);
        EXPECT_EQ(run({"call", "n1", "A", "m"}).exit, 3) << "it is held unreachable";
        const Result asked = run(command);
        EXPECT_EQ(asked.exit, 0) << command[0] << asked.out << asked.err;
    }
    remote.die();
    ASSERT_TRUE(OvraApps::PendingReleases().note(
        {"s2", OvraDRNode::Conn::https("127.0.0.1", remote.port()), "n1", "c0"}));
    for (const Arguments &command : {Arguments{"cred", "test", id},
                                     {"node", "info", "n1", "--refresh"},
                                     {"session", "pending", "--retry"}}) {
        EXPECT_EQ(run(command).exit, 3) << command[0];
    }
}

} // namespace OvradrTest
