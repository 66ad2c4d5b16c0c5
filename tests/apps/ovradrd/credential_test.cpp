// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "platform/own_files.h"
#include "support/local_node.h"
#include "support/remote_node.h"

#include <ovraplatform/appliance.h>
#include <ovraplatform/client_scope.h>

#include <barrier>
#include <future>
#include <set>

namespace {

using namespace OvraTest;

/// The appliance, and another node "n1" that grants every request.
class Credential : public Appliance {
protected:
    void SetUp() override {
        Appliance::SetUp();
        writeFile(OvraPlatform::kConfigFile, "address=\"127.0.0.1\"\n");
        addAccount("root", true);
        sid = session("root");
        remote.trust();
        remote.answer("login", R"({"success":true,"data":{"sid":"login-sid"}})");
        remote.answer("info", R"({"success":true,"data":{"node_id":"n1","serial":"S1"}})");
        remote.answer("login-sid create", R"({"success":true,"data":{"session":"granted"}})");
        remote.answer("temp_create", R"({"success":true,"data":{"session":"temporary"}})");
        remote.answer("get", R"({"success":true,"data":{"account":"joe"}})");
        // Its answers over the credential.
        remote.answer("granted create",
                      R"({"success":true,"data":{"src_cred":{"cred_id":"back"}}})");
        remote.answer("granted test_connection",
                      R"({"success":true,"data":{"addr":"10.0.0.1","protocol":"https","port":1}})");
    }
    Reply ask(const std::string &method, const Json::Value &params) const {
        return call("OVRA.DR.Node.Credential", 1, method, params, sid);
    }
    Json::Value conn() const {
        Json::Value value = json(R"({"addr":"127.0.0.1","protocol":"https"})");
        value["port"] = remote.port();
        return value;
    }
    Json::Value byAccount(const char *direction = "unidirection") const {
        Json::Value params =
            json(R"({"auth":"account","account":"joe","password":"secret","otpcode":"123456"})");
        params["conn"] = conn();
        params["cred_direction"] = direction;
        return params;
    }
    /// Creates a credential and returns its id.
    std::string make() const {
        return ask("create", byAccount()).data()["src_cred"]["cred_id"].asString();
    }
    static Json::Value credId(const std::string &id) {
        Json::Value params;
        params["cred_id"] = id;
        return params;
    }
    static std::string rows(const std::string &table) {
        return querySql("SELECT node_id, session FROM " + table);
    }

    RemoteNode remote;
    std::string sid;
};

TEST_F(Credential, IsMadeByALogIn) {
    const Reply reply = ask("create", byAccount());
    ASSERT_EQ(reply.code(), 0) << reply.text;
    EXPECT_EQ(reply.data()["src_cred"]["node_id"], "n1");
    EXPECT_EQ(reply.data()["src_cred"]["port"], remote.port());
    EXPECT_EQ(rows("node_cred"), "n1|granted\n");
    Json::Value sent = json(remote.params("login"));
    const std::string device = sent["device_token"].asString();
    sent.removeMember("device_token");
    EXPECT_EQ(sent, json(R"({"account":"joe","passwd":"secret","otp_code":"123456"})"));
    EXPECT_EQ(device.size(), 43U);
    EXPECT_EQ(modeOf(OvraPlatform::kDeviceKeyFile), 0600U);
    make();
    EXPECT_EQ(json(remote.params("login"))["device_token"], device);
    Json::Value other = byAccount();
    other["account"] = "jim";
    ask("create", other);
    EXPECT_NE(json(remote.params("login"))["device_token"], device);
    EXPECT_EQ(reply.text.find("granted"), std::string::npos);
}

TEST_F(Credential, IsMadeByASessionOrByAnotherCredential) {
    Json::Value params = json(R"({"auth":"session","session":"login-sid"})");
    params["conn"] = conn();
    params["cred_direction"] = "unidirection";
    const Reply first = ask("create", params);
    ASSERT_EQ(first.code(), 0) << first.text;

    remote.answer("granted create", R"({"success":true,"data":{"session":"granted"}})");
    params = json(R"({"auth":"cred_id","cred_direction":"unidirection"})");
    params["cred_id"] = first.data()["src_cred"]["cred_id"];
    EXPECT_EQ(ask("create", params).code(), 0);
    EXPECT_EQ(rows("node_cred"), "n1|granted\nn1|granted\n");
}

TEST_F(Credential, IsAskedForWithEveryParameterItsProofNeeds) {
    for (const char *missing : {"auth", "account", "password", "conn", "cred_direction"}) {
        Json::Value params = byAccount();
        params.removeMember(missing);
        const Reply reply = ask("create", params);
        EXPECT_EQ(reply.code(), 106) << missing;
        EXPECT_EQ(reply.document["error"]["msg"]["param"], missing);
    }
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(Credential, InBothDirectionsIsMadeThereAndBack) {
    const Reply reply = ask("create", byAccount("bidirection"));
    EXPECT_EQ(reply.data()["src_cred"]["node_id"], "n1") << reply.text;
    EXPECT_EQ(reply.data()["dst_cred"], json(R"({"cred_id":"back"})"));
    const Json::Value asked = json(remote.params("create"));
    EXPECT_EQ(asked["cred_direction"], "unidirection");
    EXPECT_EQ(asked["conn"]["addr"], "10.0.0.1");
    EXPECT_EQ(asked["_keys"].size(), 2U) << "those by which the way back is known";
}

TEST_F(Credential, InBothDirectionsIsNotBegunWithoutAnAddressOrAnAccountOfOnesOwn) {
    addAccount("plain", false);
    Json::Value params = byAccount("bidirection");
    for (const char *account : {"nobody", "plain"}) {
        params["local_account"] = account;
        EXPECT_EQ(ask("create", params).code(), 106) << account;
    }
    params.removeMember("local_account");
    const auto askHere = [&params] {
        return callHere("OVRA.DR.Node.Credential", 1, "create", params);
    };
    EXPECT_EQ(askHere()["error"]["msg"]["param"], "local_account");
    EXPECT_EQ(remote.calls(), "");
    params["local_account"] = "root";
    EXPECT_EQ(askHere()["data"]["dst_cred"], json(R"({"cred_id":"back"})"));
    remote.forgetCalls();
    writeFile(OvraPlatform::kConfigFile, "address=\"192.0.2.1\"\n");
    EXPECT_EQ(ask("create", params).code(), 401);
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(Credential, InBothDirectionsLeavesNothingWhenTheWayBackFails) {
    remote.answer("granted create", R"({"success":false,"error":{"code":500,"msg":"m"}})");
    EXPECT_EQ(ask("create", byAccount("bidirection")).code(), 500);
    EXPECT_EQ(rows("node_cred"), "");
    EXPECT_NE(remote.calls().find("granted delete"), std::string::npos);
}

TEST_F(Credential, ThatIsTemporaryStandsInATableOfItsOwn) {
    Json::Value params = byAccount();
    params.removeMember("cred_direction");
    const Reply reply = ask("temp_create", params);
    EXPECT_EQ(reply.data()["node_id"], "n1") << reply.text;
    EXPECT_EQ(rows("temp_cred"), "n1|temporary\n");

    Json::Value change = conn();
    change["cred_id"] = reply.data()["cred_id"];
    change["account"] = change["password"] = "joe";
    EXPECT_EQ(ask("set", change).code(), 106) << "its row would stay as it is";
    EXPECT_EQ(rows("temp_cred"), "n1|temporary\n");
    EXPECT_EQ(ask("delete", credId(reply.data()["cred_id"].asString())).code(), 0);
    EXPECT_EQ(rows("temp_cred"), "");
    EXPECT_NE(remote.calls().find("temporary delete"), std::string::npos);
}

TEST_F(Credential, IsOnlyTriedByATest) {
    EXPECT_EQ(ask("test_create", byAccount()).code(), 0);
    remote.answer("login-sid get", R"({"success":false,"error":{"code":106}})");
    EXPECT_EQ(ask("test_create", byAccount()).code(), 106);
    EXPECT_EQ(rows("node_cred"), "");
}

TEST_F(Credential, IsListedAndShownWithoutItsSession) {
    const std::string id = make();
    addCred("temp_cred", "n2", "c2", "https", 1, "s");
    const Reply list = ask("list", {});
    ASSERT_EQ(list.data()["creds"].size(), 2U);
    EXPECT_EQ(list.data()["creds"][0]["cred_id"], id);
    EXPECT_EQ(list.data()["creds"][0]["temporary"], false);
    EXPECT_EQ(list.data()["creds"][1]["temporary"], true);
    EXPECT_EQ(list.text.find("granted"), std::string::npos);
    // printf %s s | sha256sum
    EXPECT_EQ(list.data()["creds"][1]["session_reference"], "043a718774c572bd");
    EXPECT_EQ(ask("list", json(R"({"node_id":"n1"})")).data()["creds"].size(), 1U);
    EXPECT_EQ(ask("get", credId(id)).data()["node_id"], "n1");
}

TEST_F(Credential, IsChangedByANewLogIn) {
    Json::Value params = conn();
    params["cred_id"] = make();
    params["account"] = params["password"] = "joe";
    remote.answer("login-sid create", R"({"success":true,"data":{"session":"renewed"}})");
    EXPECT_EQ(ask("test_set", params).code(), 0);
    EXPECT_EQ(rows("node_cred"), "n1|granted\n");
    EXPECT_EQ(ask("set", params).code(), 0);
    EXPECT_EQ(rows("node_cred"), "n1|renewed\n");
    EXPECT_NE(remote.calls().find("granted delete"), std::string::npos);
    params["cred_id"] = "none";
    EXPECT_EQ(ask("set", params).code(), 404);
}

TEST_F(Credential, IsDeletedAlsoWhenItsNodeIsGone) {
    const std::string id = make();
    EXPECT_EQ(ask("delete", credId(make())).data()["release"], "kept");
    remote.server.refuse();
    EXPECT_EQ(ask("delete", credId(id)).data()["release"], "left_behind");
    EXPECT_EQ(rows("node_cred"), "");
    EXPECT_EQ(ask("delete", credId(id)).code(), 0);
}

TEST_F(Credential, IsAskedBackFromItsNode) {
    Json::Value params = credId(make());
    EXPECT_EQ(ask("test_reverse_create", params).code(), 0);
    EXPECT_EQ(ask("reverse_create", params).data()["dst_cred"], json(R"({"cred_id":"back"})"));
    remote.answer("granted temp_create", R"({"success":true,"data":{"cred_id":"temp-back"}})");
    params["conn"] = json(R"({"addr":"10.9.9.9","protocol":"https","port":7})");
    EXPECT_EQ(ask("temp_reverse_create", params).data()["dst_cred"],
              json(R"({"cred_id":"temp-back"})"));
    EXPECT_EQ(json(remote.params("test_connection"))["conns"][0]["addr"], "10.9.9.9");
}

TEST_F(Credential, DoesNotReachTheNodeItself) {
    const std::string self = call("OVRA.DR.Node", 1, "info", {}, sid).data()["node_id"].asString();
    for (const char *method : {"get", "delete", "reverse_create"}) {
        EXPECT_EQ(ask(method, credId(self)).code(), 106) << method;
    }
    remote.answer("info", R"({"success":true,"data":{"serial":"S1","node_id":")" + self + R"("}})");
    EXPECT_EQ(ask("create", byAccount()).code(), 106);
    EXPECT_EQ(rows("node_cred"), "");
}

TEST_F(Credential, OfAnotherNodeGetsOneSessionHoweverManyAskAtOnce) {
    addAccount("admin", true);
    for (int round = 0; round < 20; ++round) {
        std::barrier together(6);
        std::vector<std::future<std::string>> asked;
        for (int i = 0; i < 6; ++i) {
            asked.push_back(std::async(std::launch::async, [&] {
                const OvraPlatform::ClientScope scope("127.0.0.1");
                const Json::Value params = json(R"({"node_id":"n)" + std::to_string(round) + "\"}");
                together.arrive_and_wait();
                const Json::Value reply = callHere("OVRA.DR.Node.Session", 2, "create", params);
                return reply["data"]["session"].asString();
            }));
        }
        std::set<std::string> granted;
        for (auto &one : asked) {
            granted.insert(one.get());
        }
        EXPECT_TRUE(granted.size() == 1 && granted.count("") == 0) << round;
    }
}

TEST_F(Credential, RelaysACallAndItsReplyNoFurtherThanToItsNode) {
    Json::Value params = credId(make());
    params["webapi"] =
        json(R"({"api":"OVRA.DR.Node","version":1,"method":"relayed","params":{"a":1}})");
    remote.answer("granted relayed", R"({"success":true,"data":{"b":2}})");
    EXPECT_EQ(ask("relay", params).data(), json(R"({"b":2})"));
    EXPECT_EQ(remote.params("relayed"), R"({"a":1})");
    for (const char *code : {"105", "119", "404"}) {
        remote.answer("granted relayed",
                      std::string(R"({"success":false,"error":{"code":)") + code + "}}");
        EXPECT_EQ(std::to_string(ask("relay", params).code()), code);
    }
    remote.forgetCalls();
    params["webapi"]["api"] = "OVRA.DR.Node.Credential";
    params["webapi"]["method"] = "relay";
    EXPECT_EQ(ask("relay", params).code(), 106);
    params["webapi"] = json(R"({"api":"","version":1,"method":"m","params":{}})");
    EXPECT_EQ(ask("relay", params).code(), 106);
    EXPECT_EQ(remote.calls().find("relay"), std::string::npos);
}

} // namespace
