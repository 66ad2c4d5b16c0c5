// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_api.h"

#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode::WebAPI {

namespace {

constexpr int kVersion = 1;
/// Version 2 of the session request names the node that the session is for.
constexpr int kSessionCreateVersion = 2;

constexpr const char *kAuthAccount = "account";
constexpr const char *kAuthSession = "session";
constexpr const char *kAuthCredId = "cred_id";
constexpr const char *kUnidirection = "unidirection";
constexpr const char *kTestPrivilege = "test_privilege";
constexpr const char *kRelay = "relay";

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

Request nodeRequest(const char *method) {
    return {Word::kNodeApi, kVersion, method, Json::Value()};
}

Request credRequest(const char *method) {
    return {Word::kCredentialApi, kVersion, method, Json::Value()};
}

Request sessionRequest(const char *method, int version) {
    return {Word::kSessionApi, version, method, Json::Value()};
}

void addLogin(Request &request, const std::string &account, const std::string &password,
              const std::string &otpcode) {
    request.addParam(Word::kAccount, account);
    request.addParam("password", password);
    if (!otpcode.empty()) {
        request.addParam("otpcode", otpcode);
    }
}

Request credIdRequest(const char *method, const std::string &credId) {
    Request request = credRequest(method);
    request.addParam(Word::kCredId, credId);
    return request;
}

Request reverseRequest(const char *method, const std::string &credId, const Conn &conn) {
    Request request = credIdRequest(method, credId);
    if (conn.isValid()) {
        request.addParam(Word::kConn, conn.toJson());
    }
    return request;
}

/// A request for `conn`, authenticated by an account.
Request accountRequest(const char *method, const Conn &conn, const std::string &account,
                       const std::string &password, const std::string &otpcode) {
    Request request = credRequest(method);
    addLogin(request, account, password, otpcode);
    request.addParam(Word::kConn, conn.toJson());
    request.addParam("auth", kAuthAccount);
    request.setEncryptRequired(true);
    return request;
}

/// A request for `conn`, authenticated by a session.
Request sessionAuthRequest(const char *method, const Conn &conn, const std::string &session) {
    Request request = credRequest(method);
    request.addParam(Word::kSession, session);
    request.addParam(Word::kConn, conn.toJson());
    request.addParam("auth", kAuthSession);
    request.setEncryptRequired(true);
    return request;
}

/// A change of a credential: the endpoint's members are parameters themselves.
Request setRequest(const char *method, const std::string &credId, const Conn &conn,
                   const std::string &account, const std::string &password,
                   const std::string &otpcode) {
    Request request = credRequest(method);
    addLogin(request, account, password, otpcode);
    request.addParam(Word::kCredId, credId);
    request.addParam(conn.toJson());
    request.setEncryptRequired(true);
    return request;
}

} // namespace

Request OvraCoreUserGetAPI(const std::string &user) {
    if (user.empty()) {
        return {};
    }
    Request request(Word::kUserApi, kVersion, "get", Json::Value());
    request.addParam(Word::kName, user);
    return request;
}

Request getDRNodeSessionCreateAPI(const std::string &nodeId) {
    if (nodeId.empty()) {
        OVRA_ERR("Bad nodeId[%s]", nodeId.c_str());
        return {};
    }
    Request request = sessionRequest("create", kSessionCreateVersion);
    request.addParam(Word::kNodeId, nodeId);
    return request;
}

Request getDRNodeSessionTempCreateAPI() {
    return sessionRequest("temp_create", kVersion);
}

Request getDRNodeSessionDeleteAPI(const std::string &sessionId) {
    if (sessionId.empty()) {
        OVRA_ERR("Bad sessionId");
        return {};
    }
    Request request = sessionRequest("delete", kVersion);
    request.addParam(Word::kSession, sessionId);
    return request;
}

Request getDRNodeSessionGetAPI(const std::string &sessionId) {
    if (sessionId.empty()) {
        return {};
    }
    Request request = sessionRequest("get", kVersion);
    request.addParam(Word::kSession, sessionId);
    return request;
}

Request getDRNodeInfoAPI(const std::vector<std::string> &additional) {
    Request request = nodeRequest("info");
    if (!additional.empty()) {
        Json::Value names(Json::arrayValue);
        for (const std::string &name : additional) {
            names.append(name);
        }
        request.addParam(Word::kAdditional, names);
    }
    return request;
}

Request getDRNodeTestPrivilegeAPI() {
    return nodeRequest(kTestPrivilege);
}

Request getDRNodeTestConnectionAPI(const std::vector<Conn> &conns) {
    Json::Value valid(Json::arrayValue);
    for (const Conn &conn : conns) {
        if (conn.isValid()) {
            valid.append(conn.toJson());
        }
    }
    if (valid.empty()) {
        OVRA_ERR("Empty connections");
        return {};
    }
    Request request = nodeRequest("test_connection");
    request.addParam("conns", valid);
    return request;
}

Request getDRNodeTestSyncSpeedAPI(const std::string &nodeId, int retries, int timeout) {
    if (nodeId.empty() || retries < 0 || timeout < 0) {
        OVRA_ERR("invalid nodeId[%s], retries[%d], or timeout[%d]", nodeId.c_str(), retries,
                 timeout);
        return {};
    }
    Request request = nodeRequest("test_sync_speed");
    request.addParam(Word::kNodeId, nodeId);
    request.addParam("retries", retries);
    request.addParam("timeout", timeout);
    return request;
}

Request getDRNodeTestDownloadSpeedAPI(const std::string &url, int retries, int timeout) {
    if (url.empty() || retries < 0 || timeout < 0) {
        OVRA_ERR("invalid url[%s], retries[%d], or timeout[%d]", url.c_str(), retries, timeout);
        return {};
    }
    Request request = nodeRequest("test_download_speed");
    request.addParam("url", url);
    request.addParam("retries", retries);
    request.addParam("timeout", timeout);
    return request;
}

Request getDRNodeCredCreateAPI(const Conn &conn, const std::string &session,
                               const std::string &credDirection) {
    if (!conn.isValid() || session.empty() || credDirection.empty()) {
        OVRA_ERR("invalid conn[%s]/empty session or bad credType[%s]", text(conn).c_str(),
                 credDirection.c_str());
        return {};
    }
    Request request = sessionAuthRequest("create", conn, session);
    request.addParam("cred_direction", credDirection);
    return request;
}

Request getDRNodeCredCreateAPI(const Conn &conn, const std::string &account,
                               const std::string &password, const std::string &otpcode,
                               const std::string &credDirection) {
    if (!conn.isValid() || account.empty() || password.empty() || credDirection.empty()) {
        OVRA_ERR("Invalid conn[%s] or empty account[%s]/password or bad credType[%s]",
                 text(conn).c_str(), account.c_str(), credDirection.c_str());
        return {};
    }
    Request request = accountRequest("create", conn, account, password, otpcode);
    request.addParam("cred_direction", credDirection);
    return request;
}

Request getDRNodeCredCreateAPI(const std::string &credId) {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId[%s]", credId.c_str());
        return {};
    }
    Request request = credIdRequest("create", credId);
    request.addParam("auth", kAuthCredId);
    request.addParam("cred_direction", kUnidirection);
    return request;
}

Request getDRNodeCredGetAPI(const std::string &credId) {
    if (credId.empty()) {
        OVRA_ERR("credId[%s]", credId.c_str());
        return {};
    }
    return credIdRequest("get", credId);
}

Request getDRNodeCredSetAPI(const std::string &credId, const Conn &conn, const std::string &account,
                            const std::string &password, const std::string &otpcode) {
    if (!conn.isValid() || account.empty() || password.empty() || credId.empty()) {
        OVRA_ERR("empty conn[%s] or empty account[%s]/password/credId[%s]", text(conn).c_str(),
                 account.c_str(), credId.c_str());
        return {};
    }
    return setRequest("set", credId, conn, account, password, otpcode);
}

Request getDRNodeCredRelayAPI(const std::string &credId, const Request &request) {
    if (credId.empty() || !request.isValid()) {
        OVRA_ERR("Invalid credId [%s] or relayAPI [%s]", credId.c_str(),
                 OvraDRCore::toLogString(request.toJson()).c_str());
        return {};
    }
    Request relay = credRequest(kRelay);
    relay.addParam(Word::kWebApi, request.toJson());
    relay.addParam(Word::kCredId, credId);
    return relay;
}

Request getDRNodeCredReverseCreateAPI(const std::string &credId, const Conn &conn) {
    if (credId.empty()) {
        OVRA_ERR("Bad credId[%s]", credId.c_str());
        return {};
    }
    return reverseRequest("reverse_create", credId, conn);
}

Request getDRNodeTestCredReverseCreateAPI(const std::string &credId, const Conn &conn) {
    if (credId.empty()) {
        OVRA_ERR("Bad credId [%s]", credId.c_str());
        return {};
    }
    return reverseRequest("test_reverse_create", credId, conn);
}

Request getDRNodeTestCredCreateAPI(const Conn &conn, const std::string &account,
                                   const std::string &session) {
    if (!conn.isValid() || account.empty() || session.empty()) {
        OVRA_ERR("invalid conn[%s] or empty account [%s] /empty session", text(conn).c_str(),
                 account.c_str());
        return {};
    }
    Request request = sessionAuthRequest("test_create", conn, session);
    request.addParam(Word::kAccount, account);
    return request;
}

Request getDRNodeTestCredCreateAPI(const Conn &conn, const std::string &account,
                                   const std::string &password, const std::string &otpcode) {
    if (!conn.isValid() || account.empty() || password.empty()) {
        OVRA_ERR("invalid conn[%s] or empty account [%s] /empty password", text(conn).c_str(),
                 account.c_str());
        return {};
    }
    return accountRequest("test_create", conn, account, password, otpcode);
}

Request getDRNodeTestCredSetAPI(const std::string &credId, const Conn &conn,
                                const std::string &account, const std::string &password,
                                const std::string &otpcode) {
    if (credId.empty() || !conn.isValid() || account.empty() || password.empty()) {
        OVRA_ERR("invalid credId[%s] or conn[%s] or empty account [%s] /empty password",
                 credId.c_str(), text(conn).c_str(), account.c_str());
        return {};
    }
    return setRequest("test_set", credId, conn, account, password, otpcode);
}

Request getDRNodeTempCredCreateAPI(const Conn &conn, const std::string &account,
                                   const std::string &password, const std::string &otpcode) {
    if (!conn.isValid() || account.empty() || password.empty()) {
        OVRA_ERR("invalid conn[%s] or empty account [%s] /empty password", text(conn).c_str(),
                 account.c_str());
        return {};
    }
    return accountRequest("temp_create", conn, account, password, otpcode);
}

Request getDRNodeTempCredCreateAPI(const Conn &conn, const std::string &session) {
    if (!conn.isValid() || session.empty()) {
        OVRA_ERR("invalid conn[%s]/empty session", text(conn).c_str());
        return {};
    }
    return sessionAuthRequest("temp_create", conn, session);
}

Request getDRNodeTempCredReverseCreateAPI(const std::string &credId, const Conn &conn) {
    if (credId.empty()) {
        OVRA_ERR("Bad credId[%s]", credId.c_str());
        return {};
    }
    return reverseRequest("temp_reverse_create", credId, conn);
}

bool isRelayTestPrivilegeAPI(const Request &request) {
    if (request.getMethod() != kRelay || request.getAPI() != Word::kCredentialApi) {
        return false;
    }
    const Json::Value &params = request.getParams();
    if (!params.isObject() || !params.isMember(Word::kWebApi)) {
        return false;
    }
    const Request relayed(params[Word::kWebApi]);
    return relayed.getMethod() == kTestPrivilege && relayed.getAPI() == Word::kNodeApi;
}

} // namespace OvraDRNode::WebAPI
