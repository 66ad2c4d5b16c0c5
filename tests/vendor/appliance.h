// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/local_node.h"

#include <ovradrcore/json.h>
#include <ovradrnode/ovradrnode.h>
#include <ovravendor/stand_in.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

namespace OvraTest {

inline Json::Value json(const std::string &text) {
    Json::Value value;
    EXPECT_TRUE(OvraDRCore::fromString(value, text)) << text;
    return value;
}

/// A node behind one endpoint that handles the requests of other nodes. Its account is "joe" with
/// the password "pw".
class PeerNode {
public:
    explicit PeerNode(const std::string &host, const std::string &nodeId = "n1")
        : conn(OvraDRNode::Conn::https(host, 5001))
        , remote(OvraVendor::credentialLibrary().remotes["https://" + host + ":5001"])
        , nodeId_(nodeId) {
        remote.answer = [this](const OvraVendor::Call &call) { return answer(call); };
    }

    /// The answer to a method from now on, as JSON text.
    std::map<std::string, std::string> answers;
    OvraDRNode::Conn conn;
    OvraVendor::Remote &remote;

    /// "session method" of each call since this was last called, joined by ", ".
    std::string calls() {
        std::string text;
        for (const OvraVendor::Call &call : remote.calls) {
            text += (text.empty() ? "" : ", ") + call.session + " " + call.method;
        }
        remote.calls.clear();
        return text;
    }
    /// The first call of `method` so far; an empty one if there was none.
    OvraVendor::Call callOf(const std::string &method) const {
        const auto found =
            std::find_if(remote.calls.begin(), remote.calls.end(),
                         [&method](const auto &call) { return call.method == method; });
        return found != remote.calls.end() ? *found : OvraVendor::Call();
    }
    /// Stores a credential for this node with a session known to it.
    void grant(const std::string &credId, const std::string &session) {
        remote.sessions.insert(session);
        executeSql("INSERT INTO node_cred VALUES ('" + conn.addr + "', 'https', 5001, '" + credId +
                   "', '" + nodeId_ + "', '" + session + "')");
    }

private:
    Json::Value answer(const OvraVendor::Call &call) {
        if (answers.count(call.method) != 0) {
            return json(answers[call.method]);
        }
        Json::Value data(Json::objectValue);
        if (call.api == "OVRA.DR.Node" && call.method == "info") {
            data = json(R"({"serial":"S1","hostname":"peer","additional":{"timezone":"UTC"}})");
            data["node_id"] = nodeId_;
        } else if (call.api == "OVRA.DR.Node" && call.method == "test_connection") {
            data = call.params["conns"][0];
        } else if (call.api == "OVRA.DR.Node" && call.method == "test_download_speed") {
            data["speed"] = "11 MB/s";
        } else if (call.api == "OVRA.DR.Node.Session" && call.method == "get") {
            data["account"] = "joe";
        } else if (call.api == "OVRA.DR.Node.Session" && call.method == "delete") {
            remote.sessions.erase(call.params["session"].asString());
        } else if (call.api == "OVRA.DR.Node.Session") {
            const std::string session = "granted-" + std::to_string(++granted_);
            remote.sessions.insert(session);
            data["session"] = session;
        } else if (call.api == "OVRA.DR.Node.Credential") {
            data["src_cred"]["cred_id"] = "r1";
        }
        Json::Value document;
        document["success"] = true;
        document["data"] = data;
        return document;
    }

    std::string nodeId_;
    int granted_ = 0;
};

/// A provisioned node on the stand-ins. Each case must release every resource of the vendor's
/// libraries, exactly once.
class Appliance : public testing::Test {
protected:
    void SetUp() override {
        provisionNode();
        OvraVendor::webApiLibrary().answer = [](const OvraVendor::Call &call,
                                                const std::string &user) {
            const bool known = user == "admin" && call.params["name"] == "joe";
            return json(known ? R"({"success":true})"
                              : R"({"success":false,"error":{"code":3106}})");
        };
    }
    void TearDown() override { EXPECT_EQ(OvraVendor::leftOver(), ""); }

    static std::string rows() {
        return querySql("SELECT node_id, addr, session FROM node_cred ORDER BY rowid");
    }
};

} // namespace OvraTest
