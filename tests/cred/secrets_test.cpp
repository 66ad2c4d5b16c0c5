// SPDX-License-Identifier: Apache-2.0
#include "cred/flow_fixture.h"

#include <ovradrnode/node_create.h>
#include <ovradrnode/node_delete.h>
#include <ovradrnode/node_set.h>

#include <filesystem>
#include <set>
#include <sstream>

using namespace OvraDRNode;
using namespace OvraTest;

namespace {

/// Every secret has the word "canary" in it.
class Canary : public ReverseCreation {
protected:
    void arrange() {
        std::filesystem::remove_all("/tmp/.ovradrcache");
        executeSql("DELETE FROM node_cred; DELETE FROM temp_cred");
        addNodeCred("c1", "canary-old");
        addCred("temp_cred", "n1", "t1", "https", remote.port(), "canary-temp");
        remote.forgetAnswers();
        arrangeAnswers();
        arrangeWayBack();
        remote.answer("login", R"({"success":true,"data":{"sid":"canary-sid"}})");
        remote.answer("create", R"({"success":true,"data":{"session":"canary-new",)"
                                R"("src_cred":{"cred_id":"r1"}}})");
        remote.answer("temp_create", R"({"success":true,"data":{"session":"canary-new"}})");
        remote.forgetCalls();
    }
    /// Whether it succeeds does not matter here.
    template <typename Flow, typename Steps>
    static std::string carryOut(Steps steps) {
        Flow flow;
        (void)steps(flow);
        return OvraDRCore::toString(flow.GetErr());
    }
    /// The methods of the calls so far.
    std::set<std::string> methods() {
        std::set<std::string> found;
        std::istringstream calls(remote.calls());
        for (std::string call; std::getline(calls, call, ',');) {
            found.insert(call.substr(call.rfind(' ') + 1));
        }
        return found;
    }
};

} // namespace

TEST_F(Canary, NoSecretIsLoggedWhicheverStepFails) {
    using Reverse = CredReverseCreate;
    const auto logIn = [this](auto &flow) {
        return flow.setCred(conn, "joe", "canary-pw", "canary-otp");
    };
    const auto byAccount = [&](auto &flow) { return logIn(flow) && flow.process(); };
    const auto back = [this](auto &flow) { return arm(flow) && flow.process(); };
    const std::function<std::string()> flows[] = {
        [&] { return carryOut<DRNodeCredCreate>(byAccount); },
        [&] { return carryOut<TempCredCreate>(byAccount); },
        [&] { return carryOut<DRNodeCredCreate>([&](auto &f) { return logIn(f) && f.check(); }); },
        [&] {
            return carryOut<DRNodeCredCreate>(
                [&](auto &f) { return f.setCred(conn, "canary-lent") && f.process(); });
        },
        [&] {
            return carryOut<DRNodeCredCreate>(
                [](auto &f) { return f.setCred("c1") && f.process(); });
        },
        [&] {
            return carryOut<DRNodeCredSet>(
                [&](auto &f) { return f.setCredId("c1") && byAccount(f); });
        },
        [&] { return std::to_string(DRNodeCredDelete("c1").process()); },
        [&] { return std::to_string(TempCredDelete("t1").process()); },
        [&] { return carryOut<Reverse>(back); },
        [&] { return carryOut<Reverse>([&](auto &f) { return arm(f) && f.check(); }); },
        [&] { return carryOut<TempCredReverseCreate>(back); },
    };
    std::string echo;
    for (const char *name :
         {"password", "passwd", "otpcode", "otp_code", "session", "_sid", "sid", "token",
          "access_token", "sealed", "sealed_reply", "reply_key", "secret", "device_token"}) {
        echo += (echo.empty() ? "{\"" : ",\"") + std::string(name) + R"(":["canary-echo"])";
    }
    echo += "}";
    const SealingDaemon::Reply failures[] = {
        R"({"success":false,"error":{"code":999,"msg":)" + echo + "}}",
        R"({"success":true,"data":)" + echo + "}",
        R"({"success":"canary-echo","data":)" + echo + "}",
        Answer::closed(),
    };
    int runs = 0;
    const auto look = [&](const std::string &error, const std::string &what) {
        ++runs;
        EXPECT_TRUE(error.find("canary") == std::string::npos ||
                    error.find("canary-echo") != std::string::npos)
            << what << error;
        for (const std::string &line : log.lines()) {
            // The one line that names the session that was granted but does not work.
            EXPECT_TRUE(line.find("canary") == std::string::npos ||
                        line.find("Invalie session[") != std::string::npos)
                << what << line;
        }
        log.clear();
    };
    for (const auto &flow : flows) {
        arrange();
        look(flow(), "success: ");
        for (const std::string &method : methods()) {
            for (const auto &failure : failures) {
                arrange();
                for (const std::string &call : {method, "canary-sid " + method}) {
                    std::visit([&](const auto &reply) { remote.answer(call, reply); }, failure);
                }
                look(flow(), method + ": ");
            }
        }
    }
    EXPECT_GT(runs, 150);
}
