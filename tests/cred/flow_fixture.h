// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/local_node.h"
#include "support/log_capture.h"
#include "support/remote_node.h"

#include <ovradrnode/conn.h>
#include <ovradrnode/dr_node.h>

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
