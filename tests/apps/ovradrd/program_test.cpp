// SPDX-License-Identifier: Apache-2.0
#include "service/certificate.h"
#include "support/local_node.h"
#include "support/misbehaving_server.h"
#include "support/soon.h"
#include "the_program.h"

#include <ovraplatform/appliance.h>
#include <ovraplatform/peer_trust.h>

#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <array>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <functional>
#include <thread>

namespace {

using namespace OvraTest;
using namespace std::chrono_literals;

constexpr char kNode[] = "OVRA.DR.Node";

TEST_F(TheProgram, DoesNotStartWithWhatItCannotUse) {
    const auto says = [](const char *what, int code) {
        Program program;
        EXPECT_NE(program.line().find(what), std::string::npos) << what;
        EXPECT_EQ(program.wait(), code) << what;
    };
    configure("hostname=\"a b\"\n");
    says("hostname", 1);
    configure();
    chmod(OvraPlatform::kTlsKeyFile, 0604);
    says("0600", 1);
    std::filesystem::remove(OvraPlatform::kTlsKeyFile);
    says("run ovradr setup", 9);
    ASSERT_TRUE(OvraService::createTlsKey(OvraPlatform::kTlsKeyFile));
    says("not a key and its certificate", 1);
    std::filesystem::remove(kNodeDatabase);
    says("run ovradr setup", 9);
    EXPECT_EQ(DaemonProgram({OVRADRD_PROGRAM, "--version"}).wait(), 0);
    EXPECT_EQ(DaemonProgram({OVRADRD_PROGRAM, "--unknown"}).wait(), 2);
}

TEST_F(TheProgram, SaysSoWhenItsThreadsCannotAllBeStarted) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "a sanitizer needs more memory than any limit would leave";
#endif
    configure();
    constexpr rlim_t kGiB = rlim_t{1} << 30;
    for (const rlim_t threads :
         {1UL, 4UL, 11UL, 29UL, 44UL, 54UL}) { // every thread takes a GiB for its stack
        Program program([threads] {
            rlimit limit{};
            getrlimit(RLIMIT_STACK, &limit);
            limit.rlim_cur = kGiB;
            setrlimit(RLIMIT_STACK, &limit);
            getrlimit(RLIMIT_AS, &limit);
            limit.rlim_cur = (threads + 1) * kGiB;
            setrlimit(RLIMIT_AS, &limit);
        });
        EXPECT_NE(program.line().find("start a thread"), std::string::npos) << threads;
        EXPECT_EQ(program.wait(), 1) << threads;
    }
}

TEST_F(TheProgram, GivesNothingElseTheStandardDescriptors) {
    configure();
    Program program([] {
        for (const int fd : {0, 1, 2}) {
            close(fd);
        }
    });
    EXPECT_TRUE(soon([] { return Appliance::callHere(kNode, 1, "info")["success"] == true; }));
    for (const int fd : {0, 1, 2}) {
        const auto opened = "/proc/" + std::to_string(program.pid()) + "/fd/" + std::to_string(fd);
        EXPECT_EQ(std::filesystem::read_symlink(opened), "/dev/null");
    }
}

TEST_F(TheProgram, ServesUntilItIsToldToEndAndAgainAfterItWasKilled) {
    configure();
    for (const int signal : {SIGKILL, SIGTERM, SIGINT}) {
        Program program;
        ASSERT_EQ(program.line(), ready);
        Program second;
        EXPECT_NE(second.line().find("in use"), std::string::npos);
        EXPECT_EQ(second.wait(), 3);
        EXPECT_EQ(Appliance::callHere(kNode, 1, "info")["success"], true);
        EXPECT_EQ(Appliance::callHere("OVRA.Core.Farlink", 1, "get")["data"]["enabled"], false);
        kill(program.pid(), signal);
        EXPECT_EQ(program.wait(), signal == SIGKILL ? -1 : 0);
        EXPECT_EQ(std::filesystem::exists(OvraPlatform::kSocketFile), signal == SIGKILL);
    }
    EXPECT_EQ(Appliance::callHere(kNode, 1, "info")["error"]["code"], 100);
}

TEST_F(TheProgram, TellsTheServiceManagerHowItIsAndServesARenewedKeyOnSighup) {
    configure();
    const int manager = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    const sockaddr_un address{AF_UNIX, "/tmp/manager"};
    ASSERT_EQ(bind(manager, reinterpret_cast<const sockaddr *>(&address), sizeof(address)), 0);
    const auto told = [manager](const std::string &what) {
        pollfd wait{manager, POLLIN, 0};
        for (std::array<char, 512> text{}; poll(&wait, 1, 10'000) > 0; text = {}) {
            if (recv(manager, text.data(), text.size() - 1, 0) > 0 &&
                std::string(text.data()).find(what) != std::string::npos) {
                return true;
            }
        }
        return false;
    };
    Program program([] { setenv("NOTIFY_SOCKET", "/tmp/manager", 1); });
    EXPECT_TRUE(told("READY=1\nSTATUS=https " + https));
    const auto reload = [&](const char *outcome) {
        kill(program.pid(), SIGHUP);
        EXPECT_TRUE(told("RELOADING=1\nMONOTONIC_USEC="));
        EXPECT_TRUE(told("READY=1\nSTATUS=" + std::string(outcome))) << outcome;
        EXPECT_TRUE(told("WATCHDOG=1"));
        const auto met = OvraPlatform::peerFingerprint("https", "127.0.0.1", std::stoi(https), 10);
        return met ? met->fingerprint : std::string();
    };
    const std::string before =
        OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    writeFile(OvraPlatform::kConfigFile, "http_port=\"x\"\n");
    EXPECT_EQ(reload("Goes on with its settings"), before);
    configure("address=\"127.0.0.2\"\n");
    EXPECT_EQ(reload("Restart to serve"), before);
    configure();
    std::filesystem::remove(OvraPlatform::kTlsKeyFile);
    EXPECT_EQ(reload("Goes on with its certificate"), before);
    std::filesystem::remove(OvraPlatform::kTlsCertificateFile);
    ASSERT_TRUE(OvraService::createTlsKey(OvraPlatform::kTlsKeyFile));
    ASSERT_TRUE(OvraService::createCertificate(OvraPlatform::kTlsCertificateFile,
                                               OvraPlatform::kTlsKeyFile, {"nas", {}}));
    EXPECT_EQ(reload("Key and certificate were read again"),
              OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile));
    kill(program.pid(), SIGTERM);
    EXPECT_TRUE(told("STOPPING=1"));
    EXPECT_EQ(program.wait(), 0);
    close(manager);
}

TEST_F(TheProgram, EndsInTimeWhileACallWaitsForAnotherAppliance) {
    configure();
    MisbehavingServer silent;
    silent.fallSilent();
    Program program;
    ASSERT_EQ(program.line(), ready);
    Json::Value params = json(R"({"conns":[{"addr":"127.0.0.1","protocol":"http"}]})");
    params["conns"][0]["port"] = silent.port();
    Json::Value reply;
    std::thread caller([&] { reply = Appliance::callHere(kNode, 1, "test_connection", params); });
    EXPECT_TRUE(soon([&] { return silent.connections() > 0; }));
    const auto begun = std::chrono::steady_clock::now();
    kill(program.pid(), SIGTERM);
    EXPECT_EQ(program.wait(), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - begun, 5s);
    caller.join();
    EXPECT_EQ(reply["error"]["code"], 107);
    EXPECT_FALSE(std::filesystem::exists(OvraPlatform::kSocketFile));
}

} // namespace
