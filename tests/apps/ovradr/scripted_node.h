// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "program.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <gtest/gtest.h>

namespace OvradrTest {

inline std::string success(const std::string &data) {
    return R"({"success":true,"data":)" + data + "}";
}
inline std::string refusal(int code) {
    return R"({"success":false,"error":{"code":)" + std::to_string(code) + "}}";
}

/// An appliance that is set up, and a node "n1" with scripted answers, which lets bob in and grants
/// the session "granted-s3cret".
class ScriptedNode : public testing::Test {
protected:
    ScriptedNode() {
        EXPECT_EQ(run({"setup"}).exit, 0);
        admitBob(remote);
    }

    static void admitBob(OvraTest::RemoteNode &node) {
        node.answer("login", success(R"({"sid":"login-s3cret"})"));
        node.answer("info", success(R"({"node_id":"n1","serial":"S1","hostname":"far-host"})"));
        node.answer("create", success(R"({"session":"granted-s3cret"})"));
        node.answer("temp_create", success(R"({"session":"short-lived"})"));
    }
    /// The command with what it needs to log in as bob.
    static Result logIn(const OvraTest::RemoteNode &node, const Arguments &command) {
        return run(asBob(node, command), "secret word\n");
    }
    static Arguments asBob(const OvraTest::RemoteNode &node, const Arguments &command) {
        return command + Arguments{"--account", "bob", "--password-stdin", "--fingerprint",
                                   node.server.fingerprint()};
    }
    static std::string urlOf(const OvraTest::RemoteNode &node) {
        return "https://127.0.0.1:" + std::to_string(node.port());
    }

    OvraTest::RemoteNode remote;
    const std::string url = urlOf(remote);
};

} // namespace OvradrTest
