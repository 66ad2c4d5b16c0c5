// SPDX-License-Identifier: Apache-2.0
#include "program.h"
#include "support/misbehaving_server.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <iterator>
#include <sstream>

namespace OvradrTest {

TEST(CommandLine, EveryFailureIsOneSentenceForPeopleAndOneDocumentForScripts) {
    const std::string dead = "https://127.0.0.1:" + std::to_string(OvraTest::unusedPort());
    ASSERT_EQ(run({"setup"}).exit, 0);
    const std::tuple<Arguments, int, const char *> cases[] = {
        {{"user", "add", "b\x1b[2Jb", "--password-stdin"}, 2, "usage"},
        {{"cred", "list", "--bogus"}, 2, "usage"},
        {{"cred", "create", "nas2", "--account", "bob", "--password-stdin"}, 2, "usage"},
        {{"cred", "create", dead, "--account", "bob", "--fingerprint", "x"}, 2, "usage"},
        {{"cred", "create", dead, "--account", "bob", "--password-stdin"}, 3, "not_reachable"},
        {{"cred", "create", "flk:nowhere", "--account", "bob"}, 3, "not_reachable"},
        {{"conn", "test", dead}, 3, "not_reachable"},
        {{"conn", "test", "https://no-such-host.invalid"}, 3, "not_reachable"},
        {{"conn", "forget", dead}, 7, "not_found"},
        {{"cred", "show", "nothing"}, 7, "not_found"},
        {{"user", "remove", "nobody"}, 7, "not_found"},
        {{"call", "local", "A", "m", "--param", "x"}, 2, "usage"},
        {{"call", "local", "A", "m", "--param", "x:=y"}, 2, "usage"},
        {{"call", "local", "A", "m", "--param", "x=1", "--param", "x=2"}, 2, "usage"},
        {{"call", "local", "A", "m", "--params-file", "/dev/null"}, 2, "usage"},
        {{"call", "local", "A", "m", "--version", "0"}, 2, "usage"},
        {{"call", "local", "A", "m"}, 1, "internal"},
    };
    for (const auto &[arguments, exit, name] : cases) {
        SCOPED_TRACE(testing::PrintToString(arguments));
        const Result people = run(arguments, "correct horse\n");
        EXPECT_EQ(people.exit, exit) << people.err;
        EXPECT_EQ(people.out, "");
        EXPECT_EQ(people.err.rfind("ovradr: ", 0), 0U) << people.err;
        EXPECT_EQ(people.err.find('\x1B'), std::string::npos);

        const Result scripts = run(arguments + Arguments{"--json"}, "correct horse\n");
        EXPECT_EQ(scripts.exit, exit);
        EXPECT_EQ(scripts.err, "");
        const Json::Value document = scripts.json();
        ASSERT_TRUE(document.isObject()) << scripts.out;
        EXPECT_FALSE(document["success"].asBool());
        EXPECT_EQ(document["error"]["name"], name) << scripts.out;
        EXPECT_FALSE(document["error"]["message"].asString().empty());
        EXPECT_TRUE(document["error"]["hint"].isString());
    }
}

TEST(CommandLine, WhatNeedsTheDatabaseSaysWhenItIsNotSetUp) {
    for (const Arguments &arguments :
         {Arguments{"cred", "list"},
          {"cred", "show", "x"},
          {"call", "x", "A", "m"},
          {"cred", "create", "https://127.0.0.1:1", "--account", "bob", "--password-stdin"}}) {
        const Result result = run(arguments, "correct horse\n");
        EXPECT_EQ(result.exit, 9) << arguments[0] << arguments[1];
        EXPECT_NE(result.err.find("ovradr setup"), std::string::npos) << result.err;
    }
    EXPECT_FALSE(std::filesystem::exists("/usr/ovra/etc/ovradr/node.db"));
}

TEST(CommandLine, SaysToAnOrdinaryUserWhichFileHeCannotReadAndNothingElse) {
    const std::string told = "ovradr: /usr/ovra/etc/ovradr/node.db cannot be read by this user.\n"
                             "Run the command as root.\n";
    EXPECT_EQ(runAsNobody({"setup"}).err.find("cannot be read by this user"), std::string::npos);
    ASSERT_EQ(run({"setup"}).exit, 0);
    for (const char *line :
         {"setup", "node list", "node info local", "doctor", "doctor https://127.0.0.1:1",
          "cred list", "user list", "session list", "session pending", "conn local",
          "conn forget https://127.0.0.1:1", "conn trust https://127.0.0.1:1", "farlink status",
          "farlink disable", "call local A m", "invite", "invite --list", "pair 2222", "status"}) {
        std::istringstream words(line);
        const Result result = runAsNobody({std::istream_iterator<std::string>(words), {}});
        if (result.exit == kNoOtherUser) {
            GTEST_SKIP() << "there is only one user here";
        }
        EXPECT_EQ(result.exit, 9) << line;
        EXPECT_EQ(result.out + result.err, told) << line;
    }
    std::filesystem::remove_all("/tmp/.ovradrcache");
    EXPECT_EQ(runAsNobody({"conn", "test", "https://127.0.0.1:1"}).exit, 3);
    EXPECT_FALSE(std::filesystem::exists("/tmp/.ovradrcache")) << "it would be his";
}

TEST(CommandLine, WhatIsMistypedIsNamedWithWhatWasMeant) {
    const std::tuple<Arguments, const char *, const char *> cases[] = {
        {Arguments{}, "A command is missing.", "`ovradr`"},
        {{"user"}, "A command is missing.", "`ovradr user`"},
        {{"crd", "list"}, R"("ovradr crd")", "Did you mean `ovradr cred`? There are: help, "},
        {{"cred", "lsit"}, R"("ovradr cred lsit")", "Did you mean `ovradr cred list`?"},
        {{"attr", "delete", "x"}, R"("ovradr attr delete")", "There are: "},
        {{"help", "cred", "creat"}, R"("ovradr cred creat")", "`ovradr cred create`"},
        {{"-v"}, "no option -v.", "--version"},
        {{"cred", "list", "--nod=x"}, "no option --nod.", "--node? `ovradr cred list --help`"},
        {{"user", "add"}, "NAME is missing.", "`ovradr user add --help`"},
        {{"call", "x"}, "API and METHOD are missing.", "ovradr call"},
        {{"cred", "show", "a", "b"}, "more arguments than", "ovradr cred show"},
        {{"call", "x", "A", "m", "--version", "0"}, "--version: a whole number from 1 to ", ""},
        {{"session", "revoke", "--all", "x"}, "SESSION and --all do not go together.", ""},
        {{"node", "id", "--yes"}, "--yes is of use only with --reset.", ""},
        {{"user", "add", "--password-file"}, "--password-file needs a value.", ""},
        {{"call", "--cred", "a", "--cred", "b"}, "--cred is given more than once.", ""},
        {{"--json=x", "node", "id"}, "--json takes no value.", ""},
    };
    for (const auto &[arguments, message, hint] : cases) {
        const Result result = run(arguments);
        EXPECT_EQ(result.exit, 2);
        EXPECT_NE(result.err.find(message), std::string::npos) << result.err;
        EXPECT_NE(result.err.find(hint), std::string::npos) << result.err;
    }
}

TEST(CommandLine, HelpAndVersionAreNoFailures) {
    EXPECT_EQ(run({"--version"}).out, "ovradr " OVRADR_VERSION "\n");
    EXPECT_EQ(run({"--version", "--json"}).json()["data"]["version"], OVRADR_VERSION);
    const Result help = run({"cred", "create", "--help"});
    EXPECT_EQ(help.exit, 0);
    EXPECT_EQ(run({"help", "cred", "create"}).out, help.out);
    EXPECT_EQ(run({"help", "cred", "create", "--json"}).json()["data"]["help"], help.out);
    EXPECT_EQ(run({}).out, run({"help"}).out + "\n");
}

TEST(CommandLine, OutputThatCannotBeWrittenIsAFailure) {
    // NOLINTNEXTLINE(cert-env33-c,concurrency-mt-unsafe): the redirection is what is tested
    EXPECT_EQ(WEXITSTATUS(std::system(OVRADR_PROGRAM " node id >/dev/full 2>/tmp/said")), 1);
    EXPECT_NE(readFile("/tmp/said").find("No space left on device"), std::string::npos);
}

} // namespace OvradrTest
