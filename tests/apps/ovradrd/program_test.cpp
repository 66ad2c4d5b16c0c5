// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "platform/own_files.h"
#include "support/local_node.h"
#include "support/misbehaving_server.h"

#include <ovraplatform/appliance.h>
#include <ovraplatform/wire_form.h>
#include <ovrawebapi/api_runner.h>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <array>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <functional>
#include <thread>

namespace {

using OvraTest::Appliance;
using namespace std::chrono_literals;

/// The real program, in its own process.
class Program {
public:
    /// \param prepare  runs in the process before the program
    explicit Program(
        std::string argument = "", const std::function<void()> &prepare = [] {}) {
        int ends[2];
        if (pipe2(ends, O_CLOEXEC) != 0) {
            return;
        }
        pid_ = fork();
        if (pid_ == 0) {
            dup2(ends[1], STDOUT_FILENO);
            dup2(ends[1], STDERR_FILENO);
            prepare();
            // A daemon that exits with calls in progress abandons their threads, on purpose.
            setenv("TSAN_OPTIONS", "report_thread_leaks=0", 1);
            char program[] = OVRADRD_PROGRAM;
            std::array<char *, 3> argv{program, argument.empty() ? nullptr : argument.data()};
            execv(program, argv.data());
            _exit(127);
        }
        close(ends[1]);
        output_ = fdopen(ends[0], "r");
    }
    Program(const Program &) = delete;
    ~Program() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
        fclose(output_);
    }

    std::string line() {
        char text[512] = "";
        return fgets(text, sizeof(text), output_) != nullptr ? text : "";
    }
    void signal(int number) const { kill(pid_, number); }
    /// What the descriptor is open on.
    std::string open(int fd) const {
        std::error_code none;
        return std::filesystem::read_symlink(
            "/proc/" + std::to_string(pid_) + "/fd/" + std::to_string(fd), none);
    }
    /// The exit code; -1 if ended by a signal.
    int wait() {
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }

private:
    pid_t pid_ = -1;
    FILE *output_ = nullptr;
};

class TheProgram : public testing::Test {
protected:
    static void configure(const std::string &more = "") {
        OvraTest::writeFile(OvraPlatform::kConfigFile,
                            "address=\"127.0.0.1\"\nhttp_port=\"" + std::to_string(httpPort()) +
                                "\"\nhttps_port=\"" + std::to_string(httpsPort()) + "\"\n" + more);
    }
    static int httpPort() {
        static const int port = OvraTest::unusedPort();
        return port;
    }
    static int httpsPort() {
        static const int port = OvraTest::unusedPort();
        return port;
    }
    static std::string ready() {
        return "ovradrd: ready, https " + std::to_string(httpsPort()) + ", http " +
               std::to_string(httpPort()) + "\n";
    }
    /// The answer to a process of the appliance through the Unix socket.
    static Json::Value ask(const char *api, const char *method, const Json::Value &params = {}) {
        Json::Value reply;
        OVRA::APIRunner().Exec(reply, api, 1, method, params, "admin");
        return reply;
    }
};

TEST_F(TheProgram, DoesNotStartWhereNothingIsSetUp) {
    Program program;
    EXPECT_NE(program.line().find("run ovradr setup"), std::string::npos);
    EXPECT_EQ(program.wait(), 9);
    Appliance::provision();
    std::filesystem::remove(OvraTest::kNodeDatabase);
    EXPECT_EQ(Program().wait(), 9);
}

TEST_F(TheProgram, DoesNotStartWithWhatItCannotUse) {
    Appliance::provision();
    const std::string otherCertificate = OvraTest::readFile(OvraPlatform::kTlsCertificateFile);
    const auto says = [](const char *what) {
        Program program;
        EXPECT_NE(program.line().find(what), std::string::npos) << what;
        EXPECT_EQ(program.wait(), 1) << what;
    };
    configure("hostname=\"a b\"\n");
    says("hostname");
    configure();
    chmod(OvraPlatform::kTlsKeyFile, 0604);
    says("0600");
    std::filesystem::remove(OvraTest::kNodeDatabase);
    Appliance::provision(); // makes a new key
    OvraTest::writeFile(OvraPlatform::kTlsCertificateFile, otherCertificate);
    says("not a key and its certificate");
}

TEST_F(TheProgram, SaysSoWhenItsThreadsCannotAllBeStarted) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "a sanitizer needs more memory than any limit would leave";
#endif
    Appliance::provision();
    configure();
    constexpr rlim_t kGiB = rlim_t{1} << 30;
    for (const rlim_t threads :
         {1UL, 4UL, 11UL, 29UL, 44UL, 54UL}) { // every thread takes a GiB for its stack
        Program program("", [threads] {
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
    Appliance::provision();
    configure();
    Program program("", [] {
        for (const int fd : {0, 1, 2}) {
            close(fd);
        }
    });
    while (ask("OVRA.DR.Node", "info")["success"] != true) {
        std::this_thread::sleep_for(5ms);
    }
    for (const int fd : {0, 1, 2}) {
        EXPECT_EQ(program.open(fd), "/dev/null") << fd;
    }
}

TEST_F(TheProgram, KnowsItsArguments) {
    EXPECT_EQ(Program("--version").wait(), 0);
    EXPECT_EQ(Program("--help").wait(), 0);
    EXPECT_EQ(Program("--unknown").wait(), 2);
}

TEST_F(TheProgram, ServesUntilItIsToldToEndAndAgainAfterItWasKilled) {
    Appliance::provision();
    configure();
    for (const int signal : {SIGKILL, SIGTERM, SIGINT}) {
        Program program;
        ASSERT_EQ(program.line(), ready());
        Program second;
        EXPECT_NE(second.line().find("in use"), std::string::npos);
        EXPECT_EQ(second.wait(), 3);
        EXPECT_EQ(ask("OVRA.DR.Node", "info")["success"], true);
        EXPECT_EQ(ask("OVRA.Core.Farlink", "get")["data"]["enabled"], false);
        program.signal(signal);
        EXPECT_EQ(program.wait(), signal == SIGKILL ? -1 : 0);
        EXPECT_EQ(std::filesystem::exists(OvraPlatform::kSocketFile), signal == SIGKILL);
    }
    EXPECT_EQ(ask("OVRA.DR.Node", "info")["error"]["code"], 100);
}

TEST_F(TheProgram, EndsInTimeWhileACallWaitsForAnotherAppliance) {
    Appliance::provision();
    configure();
    OvraTest::MisbehavingServer silent;
    silent.fallSilent();
    Program program;
    ASSERT_EQ(program.line(), ready());
    Json::Value params;
    params["conns"][0]["addr"] = "127.0.0.1";
    params["conns"][0]["protocol"] = "http";
    params["conns"][0]["port"] = silent.port();
    Json::Value reply;
    std::thread caller([&] { reply = ask("OVRA.DR.Node", "test_connection", params); });
    while (silent.connections() == 0) {
        std::this_thread::sleep_for(5ms);
    }
    const auto begun = std::chrono::steady_clock::now();
    program.signal(SIGTERM);
    EXPECT_EQ(program.wait(), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - begun, 5s);
    caller.join();
    EXPECT_EQ(reply["error"]["code"], 107);
    EXPECT_FALSE(std::filesystem::exists(OvraPlatform::kSocketFile));
}

} // namespace
