// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "support/sockets.h"
#include "test_files.h"

#include <sys/stat.h>

#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <vector>

namespace {

using namespace OvraTest;

const std::string kUrl = "/webman/modules/ovradr/";
const std::string kFolder = "/usr/ovra/var/ovradr/speedtest";
const std::string kContent = "0123456789";

/// The name of a test file that ends with `digit`.
std::string named(char digit) {
    return kFolder + "/speed-" + std::string(31, 'a') + digit;
}

class TestFiles : public Appliance {
protected:
    void SetUp() override {
        Appliance::SetUp();
        std::filesystem::create_directories(kFolder);
        std::ofstream(named('0')) << kContent;
    }
    /// The whole answer to a request whose path is sent unchanged.
    std::string get(const std::string &path, const std::string &headers = "",
                    const std::string &method = "GET") const {
        const auto client = dial(port(false));
        say(client, method + " " + path + " HTTP/1.1\r\nHost: a\r\nConnection: close\r\n" +
                        headers + "\r\n");
        return hearAll(client);
    }
};

} // namespace

TEST_F(TestFiles, AreServedOverBothProtocols) {
    for (const bool tls : {true, false}) {
        const auto reply = http({.path = kUrl + named('0'), .method = "GET", .tls = tls});
        EXPECT_EQ(reply.status, 200);
        EXPECT_EQ(reply.text, kContent);
    }
    const std::string head = get(kUrl + named('0'), "", "HEAD");
    EXPECT_NE(head.find("Content-Length: 10\r\n"), std::string::npos) << head;
    EXPECT_EQ(head.find(kContent), std::string::npos);
}

TEST_F(TestFiles, AreSentInParts) {
    // The range, the status, and header and body as far as the range decides them.
    const std::array<const char *, 3> cases[] = {
        {"bytes=2-4", "206", "Content-Range: bytes 2-4/10\r\n"},
        {"bytes=2-4", "206", "\r\n\r\n234"},
        {"bytes=8-", "206", "\r\n\r\n89"},
        {"bytes=-3", "206", "\r\n\r\n789"},
        {"bytes=-99", "206", "\r\n\r\n0123456789"},
        {"bytes=5-99", "206", "\r\n\r\n56789"},
        {"bytes=10-", "416", "ends before"},
        {"bytes=-0", "416", "ends before"},
        {"bytes=4-2", "200", "\r\n\r\n0123456789"},
        {"bytes=1-2,4-5", "200", "\r\n\r\n0123456789"},
        {"bytes=18446744073709551616-", "200", "\r\n\r\n0123456789"},
        {"lines=1-2", "200", "\r\n\r\n0123456789"},
    };
    for (const auto &[range, status, rest] : cases) {
        const std::string reply = get(kUrl + named('0'), std::string("Range: ") + range + "\r\n");
        EXPECT_EQ(reply.substr(9, 3), status) << range;
        EXPECT_NE(reply.find(rest), std::string::npos) << range << reply;
    }
}

TEST_F(TestFiles, NothingElseIsReached) {
    const std::string secret = "/usr/ovra/var/ovradr/secret";
    std::vector<std::string> names{secret, "/etc/passwd", "../../../etc/passwd", "..%2f", ""};
    for (const char *end : {"/", "0", "/../../secret"}) {
        names.push_back(named('0') + end);
    }
    for (const char *rest : {"/notes", "/../secret", "/%2e%2e/secret", "%2f..%2fsecret", "", "/"}) {
        names.push_back(kFolder + rest);
    }
    names.push_back("/" + named('0'));
    std::ofstream(secret) << "not for peers";
    std::filesystem::create_symlink(secret, named('1'));
    std::filesystem::create_hard_link(secret, named('2'));
    std::ofstream(kFolder + "/notes") << "not for peers";
    ASSERT_EQ(mkfifo(named('3').c_str(), 0600), 0);
    std::filesystem::create_directory(named('4'));
    for (const char digit : {'1', '2', '3', '4', '5'}) {
        names.push_back(named(digit));
    }
    for (const std::string &name : names) {
        const std::string reply = get(kUrl + name);
        EXPECT_EQ(reply.substr(0, 12), "HTTP/1.1 404") << name << reply;
        EXPECT_EQ(reply.find("not for peers"), std::string::npos) << name;
    }
    std::filesystem::remove(named('0'));
    std::filesystem::rename(kFolder, "/usr/ovra/elsewhere");
    std::filesystem::create_symlink("/usr/ovra/elsewhere", kFolder);
    std::ofstream(named('0')) << kContent;
    EXPECT_EQ(get(kUrl + named('0')).substr(0, 12), "HTTP/1.1 404") << "the folder is a link";
}

TEST_F(TestFiles, OnlySoManyAreSentAtOnce) {
    std::filesystem::resize_file(named('0'), 64 << 20);
    restart({}, 1);
    const auto slow = dial(port(false));
    say(slow, "GET " + kUrl + named('0') + " HTTP/1.1\r\nHost: a\r\n\r\n");
    std::string reply;
    for (int i = 0; i < 5000 && reply.substr(0, 12) != "HTTP/1.1 503"; ++i) {
        reply = get(kUrl + named('0'), "Range: bytes=0-1\r\n");
    }
    EXPECT_EQ(reply.substr(0, 12), "HTTP/1.1 503") << reply;
}

TEST_F(TestFiles, AreSweptWhenNoTestCanUseThemAnyMore) {
    const std::string other = kFolder + "/other";
    for (const std::string &path : {named('1'), other}) {
        std::ofstream(path) << kContent;
        std::filesystem::last_write_time(path, std::filesystem::file_time_type::clock::now() -
                                                   std::chrono::hours(1));
    }
    Ovradrd::sweepTestFiles();
    EXPECT_TRUE(std::filesystem::exists(named('0')));
    EXPECT_FALSE(std::filesystem::exists(named('1')));
    EXPECT_TRUE(std::filesystem::exists(other)) << "nobody knows whose it is";
}
