// SPDX-License-Identifier: Apache-2.0
#include "invite_code.h"
#include "scripted_node.h"

#include <atomic>
#include <cctype>
#include <ctime>
#include <memory>
#include <tuple>

namespace OvradrTest {

namespace {

using Ovradr::InviteCode;
using Ovradr::readInviteCode;
using OvraDRNode::Conn;
using OvraTest::querySql;

InviteCode codeFor(const std::vector<Conn> &endpoints, const std::string &fingerprint) {
    InviteCode code;
    code.endpoints = endpoints;
    code.key = Ovradr::keyOf(fingerprint);
    code.reference = "0123abcd";
    code.secret = OvraBase::Secret("AAECAwQFBgcICQoL");
    code.expires = std::time(nullptr) + 60;
    return code;
}

const std::string kKey = "SHA256:" + std::string(42, 'x') + "A";

class Invited : public ScriptedNode {
protected:
    Invited() {
        remote.answer("redeem", success(R"({"sid":"short-s3cret","account":"pairing"})"));
        remote.answer("get", success(R"({"account":"pairing"})"));
    }
    std::string code(const std::string &fingerprint) const {
        return Ovradr::writeInviteCode(codeFor(
            {Conn::https("127.0.0.1", 9), Conn::https("127.0.0.1", remote.port())}, fingerprint));
    }
    static std::string credentials() { return querySql("SELECT node_id FROM node_cred"); }
    std::string trust() const {
        return run({"conn", "test", url, "--json"}).json()["data"]["trust"].asString();
    }
};

} // namespace

TEST(InviteCode, SaysWhatWasWrittenHoweverItIsTyped) {
    const InviteCode written =
        codeFor({Conn::https("192.0.2.1", 5001), Conn::https("2001:db8::1", 7),
                 Conn::https("nas.example", 5001), Conn::farlink("nas1")},
                kKey);
    const std::string text = Ovradr::writeInviteCode(written);
    std::string typed;
    for (const char c : text) {
        typed += c == '0'   ? 'o'
                 : c == '1' ? 'l'
                            : static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        typed += c == '-' ? " " : "";
    }
    for (const std::string &form : {text, typed}) {
        const auto read = readInviteCode(form);
        ASSERT_TRUE(read) << read.error().message;
        EXPECT_EQ(read->endpoints, written.endpoints);
        EXPECT_TRUE(read->isOf(kKey) && !read->isOf("SHA256:" + std::string(43, 'A')));
        EXPECT_EQ(std::tuple(read->reference, read->secret.get(), read->expires),
                  std::tuple(written.reference, written.secret.get(), written.expires));
    }
    for (std::size_t i = 0; i < text.size(); ++i) {
        std::string wrong = text;
        wrong[i] = wrong[i] == '7' ? '8' : '7';
        EXPECT_FALSE(readInviteCode(wrong)) << i;
        EXPECT_FALSE(readInviteCode(text.substr(0, i))) << i;
        wrong = text;
        if (i > 0 && text[i] != '-' && text[i - 1] != '-' && text[i] != text[i - 1]) {
            std::swap(wrong[i], wrong[i - 1]);
            EXPECT_FALSE(readInviteCode(wrong)) << i;
        }
    }
}

TEST_F(Invited, PairsWithTheApplianceOfTheCodeAndSaysSo) {
    const Result result = run({"pair", "-", "--json"}, code(remote.server.fingerprint()) + "\n");
    ASSERT_EQ(result.exit, 0) << result.out << result.err;
    EXPECT_EQ(result.json()["data"]["node_id"], "n1");
    EXPECT_EQ(result.json()["data"]["account"], "pairing");
    EXPECT_EQ(credentials(), "n1\n");
    EXPECT_EQ(trust(), "pinned");
    EXPECT_NE(remote.params("redeem").find("AAECAwQFBgcICQoL"), std::string::npos);
    EXPECT_EQ(remote.count("short-s3cret delete"), 1) << "its session has served";
    EXPECT_EQ((result.out + result.err).find("s3cret"), std::string::npos);
}

TEST_F(Invited, LeavesNothingBehindWhenAStepFails) {
    const std::string ours = code(remote.server.fingerprint());
    const std::tuple<const char *, std::string, int, const char *> cases[] = {
        {"redeem", refusal(410), 4, "invite_unknown"},
        {"redeem", refusal(411), 4, "invite_used"},
        {"redeem", refusal(412), 4, "invite_expired"},
        {"redeem", refusal(413), 4, "invite_revoked"},
        {"redeem", refusal(107), 1, "too_busy"},
        {"get", refusal(105), 7, "session_user_unknown"},
        {"info", refusal(105), 8, "no_privilege"},
        {"create", refusal(105), 8, "no_permission"},
    };
    for (const auto &[call, answer, exit, name] : cases) {
        admitBob(remote);
        remote.answer("redeem", success(R"({"sid":"short-s3cret","account":"pairing"})"));
        remote.answer("get", success(R"({"account":"pairing"})"));
        remote.answer(call, answer);
        remote.forgetCalls();
        const Result result = run({"pair", ours, "--json"});
        EXPECT_EQ(result.exit, exit) << call << result.out << result.err;
        EXPECT_EQ(result.json()["error"]["name"], name) << result.out;
        EXPECT_EQ(credentials(), "");
        EXPECT_EQ(trust(), "unknown") << call;
        EXPECT_EQ(remote.count("short-s3cret delete"), std::string(call) == "redeem" ? 0 : 1);
    }
    const std::tuple<Arguments, int> before[] = {
        // refused before anything secret is sent
        {{"pair", code(kKey)}, 6},
        {{"pair", ours, "--both"}, 1}, // no daemon runs here
        {{"pair", ours, "--account", "bob"}, 2},
        {{"pair", ours.substr(1)}, 2},
        {{"pair"}, 2},
    };
    remote.forgetCalls();
    for (const auto &[command, exit] : before) {
        EXPECT_EQ(run(command).exit, exit) << testing::PrintToString(command);
    }
    EXPECT_EQ(remote.count(" redeem"), 0) << remote.calls();
    EXPECT_EQ(run({"conn", "trust", url, "--fingerprint", remote.server.fingerprint()}).exit, 0);
    remote.answer("redeem", refusal(411));
    EXPECT_EQ(run({"pair", ours}).exit, 4);
    EXPECT_EQ(trust(), "pinned") << "what a person trusted before stays";
}

TEST_F(Invited, OfEightAtOnceOnePairsAndKeepsTheKey) {
    std::atomic<int> redeemed = 0;
    remote.before("redeem", [&] {
        if (redeemed++ > 0) {
            remote.answer("redeem", refusal(411));
        }
    });
    std::vector<std::unique_ptr<Program>> programs;
    for (int i = 0; i < 8; ++i) {
        programs.push_back(
            std::make_unique<Program>(Arguments{"pair", code(remote.server.fingerprint())}));
    }
    int paired = 0;
    for (const auto &program : programs) {
        const Result result = program->finish();
        EXPECT_TRUE(result.exit == 0 || result.exit == 4) << result.err;
        paired += result.exit == 0 ? 1 : 0;
    }
    EXPECT_EQ(paired, 1);
    EXPECT_EQ(credentials(), "n1\n");
    EXPECT_EQ(trust(), "pinned");
}

TEST_F(Invited, AtATerminalTheCodeIsAskedFor) {
    Terminal terminal({"pair"});
    ASSERT_TRUE(terminal.answers("or its URL: ", code(remote.server.fingerprint())));
    EXPECT_EQ(terminal.finish(), 0) << terminal.screen();
    EXPECT_EQ(credentials(), "n1\n");
}

} // namespace OvradrTest
