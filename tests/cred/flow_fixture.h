// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/remote_node.h"

#include <ovradrcore/json.h>
#include <ovradrnode/conn.h>
#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/api_registry.h>
#include <ovraplatform/session_store.h>

#include <gtest/gtest.h>

#include <string>

/// A provisioned local node and a remote node "n1" that grants every request: log-in session
/// "login-sid", node session "granted", temporary session "temp-granted", account "joe".
class CredFlow : public testing::Test {
protected:
    void SetUp() override {
        OvraTest::provisionNode();
        OvraDRNode::DRNode::getLocalNodeId();
        SetUpAnswers();
    }
    void SetUpAnswers() {
        remote.answer("granted test_privilege", R"({"success":true})");
        remote.answer("login", R"({"success":true,"data":{"sid":"login-sid"}})");
        remote.answer("info", R"({"success":true,"data":{"node_id":"n1","serial":"S1",)"
                              R"("hostname":"b"}})");
        remote.answer("create", R"({"success":true,"data":{"session":"granted"}})");
        remote.answer("temp_create", R"({"success":true,"data":{"session":"temp-granted"}})");
        remote.answer("get", R"({"success":true,"data":{"account":"joe"}})");
    }
    std::string rows(const std::string &table) {
        return OvraTest::querySql("SELECT node_id, protocol, port, session FROM " + table);
    }
    std::string granted(const std::string &session) {
        return "n1|https|" + std::to_string(remote.port()) + "|" + session + "\n";
    }
    int sent(const std::string &call) {
        const std::string all = ", " + remote.calls() + ",";
        int found = 0;
        for (std::size_t at = all.find(" " + call + ","); at != std::string::npos;
             at = all.find(" " + call + ",", at + 1)) {
            ++found;
        }
        return found;
    }

    OvraTest::RemoteNode remote;
    OvraDRNode::Conn conn = OvraDRNode::Conn::https("127.0.0.1", remote.port());
    LogCapture log;
};

/// The remote reaches this node at 192.0.2.1:5001 and reports a credential "r1".
class ReverseCreation : public CredFlow {
protected:
    void SetUp() override {
        CredFlow::SetUp();
        OvraTest::addCred("node_cred", "n1", "c1", "https", remote.port(), "s1");
        arrangeWayBack();
    }
    void arrangeWayBack() {
        remote.answer(
            "test_connection",
            R"({"success":true,"data":{"addr":"192.0.2.1","protocol":"https","port":5001}})");
        remote.answer("create", R"({"success":true,"data":{"src_cred":{"cred_id":"r1"}}})");
        remote.answer("temp_create", R"({"success":true,"data":{"cred_id":"t1"}})");
        for (const char *call : {"create", "temp_create", "test_create"}) {
            remote.before(call, [this, call] { noteSession(call); });
        }
        users.add("OVRA.Core.User", 1, "get", OvraPlatform::APIRight::kAdministrator,
                  OvraPlatform::APIQueue::kQuick,
                  [](const Json::Value &params, const OvraPlatform::APICaller &) {
                      return params["name"] == "joe" ? OvraPlatform::apiSuccess()
                                                     : OvraPlatform::apiError(1);
                  });
        users.host();
    }
    /// What the temporary session permitted while the remote had it.
    void noteSession(const std::string &call) {
        Json::Value params;
        EXPECT_TRUE(OvraDRCore::fromString(params, remote.params(call)));
        lent = params["session"].asString();
        lentUser = OvraDRNode::NodeSession().GetUserBySession(lent);
        const auto session = OvraPlatform::SessionStore().find(lent);
        lentSeconds = session ? session->expires.value_or(0) - session->created : 0;
    }
    bool isGone() {
        return !lent.empty() && OvraDRNode::NodeSession().GetUserBySession(lent).empty();
    }
    bool arm(OvraDRNode::CredReverseCreate &flow, const std::string &account = "joe") {
        return flow.setCredId("c1") && flow.setLocalAccount(account) &&
               flow.addLocalConns({OvraDRNode::Conn::https("192.0.2.1", 5001),
                                   OvraDRNode::Conn::http("192.0.2.1", 5000)});
    }

    OvraPlatform::APIRegistry users;
    std::string lent;
    std::string lentUser;
    std::int64_t lentSeconds = 0;
};
