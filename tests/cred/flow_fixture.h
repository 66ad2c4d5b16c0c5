// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/node_fixture.h"

#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/node_session.h>
#include <ovraplatform/session_store.h>

/// A remote node "n1" that grants every request: log-in session "login-sid", node session
/// "granted", temporary session "temp-granted", account "joe".
class CredFlow : public OvraTest::TwoNodes {
protected:
    CredFlow() { arrangeAnswers(); }
    void arrangeAnswers() {
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
    long sent(const std::string &call) const { return remote.count(call); }
};

/// The remote reaches this node at 192.0.2.1:5001 and reports a credential "r1".
class ReverseCreation : public CredFlow {
protected:
    ReverseCreation() {
        addNodeCred("c1", "s1");
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

    std::string lent;
    std::string lentUser;
    std::int64_t lentSeconds = 0;
};
