// SPDX-License-Identifier: Apache-2.0
#include "platform/own_files.h"
#include "webapi/local_address.h"
#include "webapi/local_wire.h"

#include <ovrabase/unique_fd.h>
#include <ovradrcore/json.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/local_server.h>
#include <ovrawebapi/api_runner.h>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <future>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace OvraPlatform;
using namespace std::chrono_literals;

Json::Value echo(const LocalCall &call) {
    Json::Value data;
    data["call"] = call.api + std::to_string(call.version) + call.method + call.user;
    data["params"] = call.params;
    return apiSuccess(data);
}

int codeOf(const Json::Value &reply) {
    return reply["success"].asBool() ? 0 : reply["error"]["code"].asInt();
}

Json::Value ask(const char *method = "get", const Json::Value &params = Json::Value()) {
    Json::Value out;
    OVRA::APIRunner().Exec(out, "Test", 1, method, params, "admin");
    return out;
}

OvraBase::UniqueFd connectRaw() {
    OvraBase::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    return connectLocal(fd.get(), *localAddress(kSocketFile)) ? std::move(fd)
                                                              : OvraBase::UniqueFd();
}

/// The server's answer to these bytes; "" if it just closes the connection.
std::string answerTo(const std::string &bytes) {
    const OvraBase::UniqueFd fd = connectRaw();
    send(fd.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    shutdown(fd.get(), SHUT_WR);
    return receiveFrame(fd.get(), std::chrono::steady_clock::now() + 5s).value_or("");
}

/// A process with a server, as soon as that listens.
struct Daemon : OvraTest::OtherProcess {
    explicit Daemon(const LocalHandler &handler)
        : OtherProcess([&] {
            LocalServer server(kSocketFile, handler);
            static_cast<void>(server.start());
            return pause();
        }) {
        while (!connectRaw()) {
            std::this_thread::sleep_for(10ms);
        }
    }
};

struct LocalCallScene : OvraTest::OwnFiles {};

TEST_F(LocalCallScene, CarriesTheWholeCallAndReplyAndSurvivesRubbish) {
    LocalServer server(kSocketFile, echo);
    ASSERT_TRUE(server.start());
    Json::Value params;
    params["text"] = std::string(100'000, 'x') + "\n\xC3\xA9";
    const Json::Value out = ask("get", params);
    EXPECT_EQ(out["data"]["call"], "Test1getadmin");
    EXPECT_EQ(out["data"]["params"], params);
    EXPECT_EQ(OvraTest::modeOf(kSocketFile), 0600U);
    EXPECT_EQ(OvraTest::modeOf(kStateDir), 0700U);
    const std::string four("\0\0\0\4", 4);
    for (const std::string &rubbish : {std::string(), std::string("\0\0", 2), four + "xy",
                                       std::string("\xFF\xFF\xFF\xFF rubbish")}) {
        EXPECT_EQ(answerTo(rubbish), "");
    }
    for (const char *text : {"GET ", "[{}]", "null"}) {
        Json::Value reply;
        ASSERT_TRUE(OvraDRCore::fromString(reply, answerTo(four + text))) << text;
        EXPECT_EQ(codeOf(reply), APIError::kBadRequest) << text;
    }
    EXPECT_EQ(codeOf(ask()), 0);
}

TEST_F(LocalCallScene, SaysSoWhenNoDaemonRunsOrItDiesDuringTheCall) {
    const Json::Value out = ask();
    EXPECT_EQ(codeOf(out), APIError::kInternal);
    EXPECT_NE(out["error"]["msg"].asString().find("ovradrd does not answer"), std::string::npos);
    const Daemon daemon([](const LocalCall &) -> Json::Value { _exit(9); });
    EXPECT_EQ(codeOf(ask()), APIError::kInternal);
}

TEST_F(LocalCallScene, ReplacesTheSocketOfADeadDaemonOnly) {
    Daemon daemon(echo);
    LocalServer second(kSocketFile, echo);
    EXPECT_FALSE(second.start());
    EXPECT_EQ(codeOf(ask()), 0) << "the first must go on answering";
    daemon.end(SIGKILL);
    LocalServer server(kSocketFile, echo);
    ASSERT_TRUE(server.start());
    EXPECT_EQ(codeOf(ask()), 0);
}

TEST_F(LocalCallScene, TakesNoPlaceThatIsNotItsOwn) {
    ASSERT_TRUE(ensureStateDir());
    OvraTest::writeFile(kSocketFile, "precious");
    LocalServer onFile(kSocketFile, echo);
    EXPECT_FALSE(onFile.start());
    EXPECT_EQ(OvraTest::readFile(kSocketFile), "precious");

    LocalServer tooLong(path(std::string(120, 'x')), echo);
    EXPECT_NE(tooLong.start().error().find("too long"), std::string::npos);
}

TEST_F(LocalCallScene, RefusesTheProcessesOfOtherUsers) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "only root can become another user";
    }
    LocalServer server(kSocketFile, echo);
    ASSERT_TRUE(server.start());
    // The modes alone would deny access: relax them, so that the peer check has to.
    ASSERT_EQ(chmod(kStateDir, 0755), 0);
    ASSERT_EQ(chmod(kSocketFile, 0666), 0);
    constexpr int kNoOtherUser = 99;
    OvraTest::OtherProcess stranger([] {
        constexpr uid_t kNobody = 65534;
        return setuid(kNobody) == 0 ? codeOf(ask()) : kNoOtherUser;
    });
    const int code = stranger.wait();
    if (code == kNoOtherUser) {
        GTEST_SKIP() << "there is no other user in this user namespace";
    }
    EXPECT_EQ(code, APIError::kNoPermission);
}

TEST_F(LocalCallScene, AnswersForAHandlerThatFails) {
    LocalServer server(kSocketFile, [](const LocalCall &call) {
        if (call.method == "throw") {
            throw std::runtime_error("broken");
        }
        return apiSuccess(std::string(kMaxFrame, 'x'));
    });
    ASSERT_TRUE(server.start());
    EXPECT_EQ(codeOf(ask("throw")), APIError::kInternal);
    EXPECT_EQ(codeOf(ask("flood")), APIError::kTooLarge);
}

TEST_F(LocalCallScene, ServesMoreCallersThanItHasThreads) {
    std::atomic<std::size_t> running{0};
    std::array<std::atomic<int>, 21> times{}; // by the number of those that run then
    LocalServer server(
        kSocketFile,
        [&](const LocalCall &call) {
            ++times.at(++running);
            std::this_thread::sleep_for(5ms);
            --running;
            return echo(call);
        },
        2);
    ASSERT_TRUE(server.start());
    std::vector<std::future<Json::Value>> callers;
    for (int i = 0; i < 20; ++i) {
        callers.push_back(std::async(std::launch::async, [] { return ask(); }));
    }
    for (auto &caller : callers) {
        EXPECT_EQ(codeOf(caller.get()), 0);
    }
    EXPECT_GT(times[2], 0);
    EXPECT_EQ(times[1] + times[2], 20);
}

TEST_F(LocalCallScene, StopsAtOnceButAnswersTheCallUnderWay) {
    std::promise<void> entered;
    LocalServer server(
        kSocketFile,
        [&](const LocalCall &call) {
            entered.set_value();
            std::this_thread::sleep_for(200ms);
            return echo(call);
        },
        2);
    ASSERT_TRUE(server.start());
    const OvraBase::UniqueFd idle = connectRaw(); // sends nothing, and must not delay the stop
    auto caller = std::async(std::launch::async, [] { return ask(); });
    entered.get_future().wait();
    const OvraBase::UniqueFd late = connectRaw(); // no thread is left for it
    const auto begin = std::chrono::steady_clock::now();
    server.stop();
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 2s);
    EXPECT_EQ(codeOf(caller.get()), 0);
    for (const int unserved : {idle.get(), late.get()}) {
        Json::Value reply;
        const auto text = receiveFrame(unserved, std::chrono::steady_clock::now() + 5s);
        EXPECT_TRUE(OvraDRCore::fromString(reply, text.value_or("")));
        EXPECT_EQ(codeOf(reply), APIError::kTooBusy) << "nothing was done";
    }
    EXPECT_NE(access(kSocketFile, F_OK), 0) << "the socket file must be gone";
}

} // namespace
