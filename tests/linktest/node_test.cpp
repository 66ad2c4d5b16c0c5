// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"

#include <ovradrnode/node.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

constexpr const char *kFolder = "/usr/ovra/ovradr/sbin/";
constexpr const char *kTestFile = "/tmp/speed-file";

void script(const std::string &name, const std::string &body) {
    std::filesystem::create_directories(kFolder);
    std::ofstream(kFolder + name) << "#!/bin/sh\n" << body << "\n";
    chmod((kFolder + name).c_str(), 0755);
}

/// Three local endpoints (two addresses, one with HTTPS only is not possible: each has both), a
/// remote node "n1", and a set-up script that makes a test file.
class Speed : public TwoNodes {
protected:
    Speed() {
        std::ofstream("/usr/ovra/etc/ovradr/ovradrd.conf")
            << "address=\"127.0.0.1,127.0.0.2\"\nhttps_port=\"444\"\nhttp_port=\"81\"\n";
        addNodeCred("c1", "s1");
        script("TestSyncSpeed.sh", "touch /tmp/speed-file; printf /tmp/speed-file");
        remote.answer("test_download_speed", R"({"success":true,"data":{"speed":"11.5 MB/s"}})");
    }
    bool fileLeft() { return access(kTestFile, F_OK) == 0; }
    // Each returns the code of the error in place of an empty text.
    std::string run(const std::string &nodeId = "n1") {
        return orCode(node.TestSyncSpeed(nodeId, 2, 3));
    }
    std::string download(const std::string &url = "u") {
        return orCode(node.TestDownloadSpeed(url, 2, 3));
    }
    std::string orCode(const std::string &text) {
        EXPECT_TRUE(text.empty() || node.GetErrCode() == 0);
        return text.empty() ? std::to_string(node.GetErrCode()) : text;
    }

    Node node;
};

} // namespace

TEST_F(Speed, TheFirstLineOfTheScriptIsTakenWhole) {
    script("TestDownloadSpeed.sh", "printf '%s %s %s' \"$1\" \"$2\" \"$3\"");
    EXPECT_EQ(download("http://h/a b;`c`"), "http://h/a b;`c` 2 3") << "no shell between";
    script("TestDownloadSpeed.sh", "echo one; echo two");
    EXPECT_EQ(download(), "one\n");
    script("TestDownloadSpeed.sh", "exit 3");
    EXPECT_EQ(download(), "407");
    std::filesystem::remove_all(kFolder);
    EXPECT_EQ(download(), "401");
    EXPECT_EQ(
        log.count("ERR", "node", "TestDownloadSpeed",
                  std::string("Failed to exec the command [") + kFolder + "TestDownloadSpeed.sh]."),
        1);
    script("TestDownloadSpeed.sh", "echo one");
    chmod("/usr/ovra/ovradr", 0777);
    EXPECT_EQ(download(), "401") << "anybody could have put the script there";
    EXPECT_EQ(log.count("is not run: others may write to /usr/ovra/ovradr:"), 1);
}

TEST_F(Speed, TheRemoteIsAskedEndpointByEndpointUntilOneWorks) {
    int asked = 0;
    remote.before("test_download_speed", [&] {
        if (++asked == 3) {
            remote.answer("test_download_speed", R"({"success":true,"data":{"speed":"3 MB/s"}})");
        }
    });
    remote.answer("test_download_speed", R"({"success":false,"error":{"code":999}})");
    EXPECT_EQ(run(), "3 MB/s");
    EXPECT_EQ(asked, 3);
    EXPECT_EQ(remote.params("test_download_speed"),
              R"({"retries":2,"timeout":3,"url":"https://127.0.0.2:444/webman/modules/ovradr//tmp/)"
              R"(speed-file"})");
    EXPECT_FALSE(fileLeft());
}

TEST_F(Speed, WhichPathsRemoveTheFileAndWhichCodeWins) {
    const struct {
        const char *answer;
        bool removable; ///< the test file
        const char *speed;
    } cases[] = {
        {R"({"success":false,"error":{"code":999}})", true, "407"},
        {R"({"success":true,"data":{}})", true, "401"},
        {R"({"success":true,"data":{"speed":12}})", true, "12"},
        {R"({"success":false,"error":{"code":999}})", false, "401"},
        {R"({"success":true,"data":{"speed":"1"}})", false, "1"},
    };
    for (const auto &each : cases) {
        script("TestSyncSpeed.sh", std::string(each.removable ? "touch /tmp/speed-file; " : "") +
                                       "printf /tmp/speed-file");
        remote.answer("test_download_speed", each.answer);
        EXPECT_EQ(run(), each.speed) << each.answer;
        EXPECT_FALSE(fileLeft()) << each.answer;
    }
    EXPECT_EQ(
        log.count("ERR", "node", "TestSyncSpeed", "Field 'speed' sould exist, being a string."), 2);
}

TEST_F(Speed, WithoutATestFileOrANodeNobodyIsAsked) {
    EXPECT_EQ(run(""), "407");
    EXPECT_TRUE(fileLeft()) << "an unknown node leaves it to the sweep";
    script("TestSyncSpeed.sh", "exit 1");
    EXPECT_EQ(run(), "401");
    std::filesystem::remove_all(kFolder);
    EXPECT_EQ(run(), "401");
    EXPECT_EQ(log.count("ERR", "node", "TestSyncSpeedMakeTestFile",
                        std::string("Failed to execute command ") + kFolder + "TestSyncSpeed.sh."),
              1);
    EXPECT_EQ(remote.calls(), "");
}
