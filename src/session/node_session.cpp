// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_session.h"

#include "ovradrnode/conn.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/sender.h"
#include "words.h"

#include <ovracgi/ovracgi.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovradrcore/util.h>

#include <json-c/json_object.h>

#include <array>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;

namespace {

constexpr std::size_t kFieldSize = 1024;
constexpr std::size_t kSessionIdSize = 100;
constexpr int kNoTimeout = -1;

/// The results of a test function for OvraCgiRemoveSessionByFunc().
constexpr int kRemove = 0;
constexpr int kKeep = 1;

/// The session store, open for one operation.
class CgiHandle {
public:
    CgiHandle() { OvraCgiInit("", &handle_); }
    ~CgiHandle() { OvraCgiFree(&handle_); }
    CgiHandle(const CgiHandle &) = delete;
    CgiHandle &operator=(const CgiHandle &) = delete;

    OvraCgi *get() { return &handle_; }
    OvraCgi *operator->() { return &handle_; }

private:
    OvraCgi handle_{};
};

struct PutRecord {
    void operator()(json_object *record) const { json_object_put(record); }
};
using Record = std::unique_ptr<json_object, PutRecord>;

/// \return false if the field cannot be read.
bool readField(json_object *record, int field, std::string &value) {
    std::array<char, kFieldSize> buffer{};
    if (OvraCgiJsonRecordGet(record, field, buffer.data(), buffer.size()) == 0) {
        return false;
    }
    buffer.back() = '\0';
    value = buffer.data();
    return true;
}

std::string nodeIdOf(json_object *record) {
    std::string extra;
    return readField(record, OVRA_CGI_FIELD_EXTRA, extra) ? NodeSession::NodeIdOf(extra) : "";
}

/// Removes every session of ours, of any user.
int isOtherApplication(json_object *record, void * /*argument*/) {
    std::string app;
    const bool ours =
        readField(record, OVRA_CGI_FIELD_APP, app) && app == NodeSession::kApplication;
    return ours ? kRemove : kKeep;
}

/// Removes every session of ours of one user; `argument` is the user name.
int RemoveSessionByUser(json_object *record, void *argument) {
    const auto *user = static_cast<const std::string *>(argument);
    if (user == nullptr || user->empty()) {
        OVRA_ERR("Null userName to delete session");
        return kKeep;
    }
    std::string owner;
    if (isOtherApplication(record, nullptr) != kRemove ||
        !readField(record, OVRA_CGI_FIELD_USER, owner) || owner != *user) {
        return kKeep;
    }
    OVRA_WARN("Delete session of userName [%s]/[%s] of nodeId[%s]", owner.c_str(), user->c_str(),
              nodeIdOf(record).c_str());
    return kRemove;
}

struct SessionSearch {
    std::string nodeId;
    std::string userName;
    std::string sessionId; ///< found
};

/// Finds the session of a node and user. It keeps every record: the iteration serves as a search.
int GetSessionIDByNodeUser(json_object *record, void *argument) {
    auto *search = static_cast<SessionSearch *>(argument);
    if (search == nullptr) {
        OVRA_ERR("Null pCred to get session");
        return kKeep;
    }
    if (search->nodeId.empty() || search->userName.empty()) {
        OVRA_WARN("empty nodeId [%s] or userName[%s]", search->nodeId.c_str(),
                  search->userName.c_str());
        return kKeep;
    }
    std::string app;
    if (!readField(record, OVRA_CGI_FIELD_APP, app)) {
        OVRA_WARN("Failed to get app of cgi");
        return kKeep;
    }
    if (app != NodeSession::kApplication) {
        return kKeep;
    }
    std::string owner;
    if (!readField(record, OVRA_CGI_FIELD_USER, owner)) {
        OVRA_WARN("Failed to get username of cgi");
        return kKeep;
    }
    if (owner == search->userName && nodeIdOf(record) == search->nodeId) {
        readField(record, OVRA_CGI_FIELD_SID, search->sessionId);
    }
    return kKeep;
}

std::string GetSessionId(const std::string &nodeId, const std::string &userName) {
    if (nodeId.empty() || userName.empty()) {
        OVRA_WARN("empty nodeID[%s] or userName[%s]", nodeId.c_str(), userName.c_str());
        return {};
    }
    SessionSearch search{nodeId, userName, {}};
    CgiHandle handle;
    if (OvraCgiRemoveSessionByFunc(handle.get(), GetSessionIDByNodeUser, &search) != 0) {
        OVRA_WARN("Failed to get session of node [%s] and userName [%s]", nodeId.c_str(),
                  userName.c_str());
    }
    return search.sessionId;
}

bool isUserExist(const std::string &userName) {
    return !userName.empty() && BaseSender::run(WebAPI::OvraCoreUserGetAPI(userName)).isSuccess();
}

/// A login without a web client has this appliance as its client.
void SetRemoteIP() {
    std::array<char, kFieldSize> client{};
    if (OvraCgiGetRemoteIP(client.data(), client.size()) != -1) {
        client.back() = '\0';
        OVRA_INFO("create session for [%s]", client.data());
        return;
    }
    OVRA_INFO("Local create session");
    const Conn conn = Conn::localHttp("127.0.0.1");
    constexpr int kOverwrite = 1;
    // The store reads the environment only here, in this thread.
    setenv("REMOTE_ADDR", conn.addr.c_str(), kOverwrite);                            // NOLINT
    setenv("REMOTE_PORT", OvraDRCore::ToString<int>(conn.port).c_str(), kOverwrite); // NOLINT
}

std::string hiddenUi() {
    Json::Value ui;
    const char *const ours = OvraCgiLoginUIJsonConfigTemplate();
    if (!OvraDRCore::fromString(ui, ours != nullptr ? ours : "") || !ui.isObject()) {
        ui = Json::Value(Json::objectValue);
    }
    ui["hide"] = true;
    return OvraDRCore::toString(ui);
}

/// Mandatory options.
bool setLoginOptions(OvraCgi *handle, int timeout) {
    constexpr int kOn = 1;
    return OvraCgiSetOption(handle, OVRA_CGI_OPT_SKIP_PASSWORD, &kOn) != 0 &&
           OvraCgiSetOption(handle, OVRA_CGI_OPT_MULTIPLE, &kOn) != 0 &&
           OvraCgiSetOption(handle, OVRA_CGI_OPT_APP, NodeSession::kApplication) != 0 &&
           OvraCgiSetOption(handle, OVRA_CGI_OPT_TIMEOUT, &timeout) != 0;
}

/// Whether a session tied to the node is found again. One that is not (the id is no UTF-8, or too
/// long) would be made anew with every call.
bool isTraceable(const std::string &nodeId) {
    const std::string extra = NodeSession::ExtraOf(nodeId);
    return extra.size() < kFieldSize && NodeSession::NodeIdOf(extra) == nodeId;
}

/// \param timeout  seconds; negative: none
/// \param nodeId   may be empty
std::string CgiLogin(const std::string &userName, int timeout, const std::string &nodeId) {
    if (userName.empty()) {
        OVRA_ERR("Empty user [%s]", userName.c_str());
        return {};
    }
    CgiHandle handle;
    std::snprintf(handle->user, sizeof(handle->user), "%s", userName.c_str());
    OVRA_INFO("login userName [%s] to create drnode session", userName.c_str());
    if (!setLoginOptions(handle.get(), timeout)) {
        OVRA_ERR("Set cgi option of [%s] failed", userName.c_str());
        return {};
    }
    if (timeout < 0) {
        const std::string ui = hiddenUi();
        if (OvraCgiSetOption(handle.get(), OVRA_CGI_OPT_UI, ui.c_str()) == 0) {
            OVRA_WARN("Failed to set ui opt[%s] of user[%s] login", ui.c_str(), userName.c_str());
        }
    }
    if (!nodeId.empty()) {
        const std::string text = NodeSession::ExtraOf(nodeId);
        if (OvraCgiSetOption(handle.get(), OVRA_CGI_OPT_EXTRA, text.c_str()) == 0) {
            OVRA_WARN("Failed to set extra opt[%s] of user[%s] login", text.c_str(),
                      userName.c_str());
        }
    }
    std::array<char, kSessionIdSize + 1> sessionId{};
    if (OvraCgiLoginNoAuth(handle.get(), sessionId.data(), kSessionIdSize, nullptr) != 1) {
        OVRA_ERR("Failed to login session of [%s] with user[%s]", NodeSession::kApplication,
                 userName.c_str());
        return {};
    }
    return sessionId.data();
}

bool CgiLogout(const std::string &sessionId) {
    CgiHandle handle;
    if (OvraCgiRemoveSessionByIndex(handle.get(), OVRA_CGI_FIELD_SID, sessionId.c_str()) != 0) {
        OVRA_ERR("Failed to remove session");
        return false;
    }
    return true;
}

} // namespace

NodeSession::~NodeSession() = default;

std::string NodeSession::NodeIdOf(const std::string &extra) {
    Json::Value parsed;
    return OvraDRCore::fromString(parsed, extra) ? OvraDRCore::memberString(parsed, Word::kNodeId)
                                                 : "";
}

std::string NodeSession::ExtraOf(const std::string &nodeId) {
    Json::Value extra(Json::objectValue);
    extra[Word::kNodeId] = nodeId;
    return OvraDRCore::toString(extra);
}

std::string NodeSession::CreateNodeSession(const std::string &nodeId, const std::string &userName) {
    SetErr(ERR::kFailed);
    if (nodeId.empty() || userName.empty() || !isTraceable(nodeId)) {
        OVRA_ERR("Bad nodeId[%s] / userName[%s]", nodeId.c_str(), userName.c_str());
        SetErr(ERR::kBadParameter);
        return {};
    }
    if (!isUserExist(userName)) {
        SetErr(ERR::kNoSuchUser, userName);
        OVRA_ERR("User [%s] is not existed", userName.c_str());
        return {};
    }
    std::string sessionId = GetSessionId(nodeId, userName);
    if (!sessionId.empty()) {
        OVRA_INFO("session of userName [%s] for node[%s] has been existed", userName.c_str(),
                  nodeId.c_str());
        SetErr(ERR::kNone);
        return sessionId;
    }
    SetRemoteIP();
    sessionId = CgiLogin(userName, kNoTimeout, nodeId);
    if (sessionId.empty()) {
        OVRA_ERR("Failed to create session for nodeId[%s]", nodeId.c_str());
        SetErr(ERR::kSessionNotCreated);
        return {};
    }
    OVRA_INFO("Create node session for node[%s] with privielge of userName[%s]", nodeId.c_str(),
              userName.c_str());
    SetErr(ERR::kNone);
    return sessionId;
}

std::string NodeSession::CreateTempSession(const std::string &userName, unsigned int timeout) {
    SetErr(ERR::kFailed);
    if (userName.empty() || timeout == 0 || timeout > INT_MAX) {
        OVRA_WARN("Bad timeout [%d]/userName [%s]", static_cast<int>(timeout), userName.c_str());
        SetErr(ERR::kBadParameter);
        return {};
    }
    if (!isUserExist(userName)) {
        SetErr(ERR::kNoSuchUser, userName);
        OVRA_ERR("User [%s] is not existed", userName.c_str());
        return {};
    }
    SetRemoteIP();
    SetErr(ERR::kNone); // a failed login shows only as an empty id
    return CgiLogin(userName, static_cast<int>(timeout), "");
}

void NodeSession::DeleteBySessionId(const std::string &sessionId) {
    SetErr(ERR::kFailed);
    if (sessionId.empty()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Bad sessionId[%s]", sessionId.c_str());
        return;
    }
    if (!CgiLogout(sessionId)) {
        OVRA_ERR("Failed to delete session [%s]", sessionId.c_str());
        SetErr(ERR::kSessionNotRemoved);
        return;
    }
    SetErr(ERR::kNone);
}

void NodeSession::DeleteByUser(const std::string &userName) {
    SetErr(ERR::kFailed);
    if (userName.empty()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("empty userName");
        return;
    }
    CgiHandle handle;
    std::string argument = userName;
    if (OvraCgiRemoveSessionByFunc(handle.get(), RemoveSessionByUser, &argument) != 0) {
        OVRA_ERR("Failed to remove session of userName [%s]", userName.c_str());
        SetErr(ERR::kSessionNotRemoved);
        return;
    }
    SetErr(ERR::kNone);
}

std::string NodeSession::GetUserBySession(const std::string &sessionId) {
    SetErr(ERR::kFailed);
    if (sessionId.empty()) {
        SetErr(ERR::kBadParameter);
        return {};
    }
    Record record; // released after the handle
    CgiHandle handle;
    json_object *found = nullptr;
    const bool known = OvraCgiGetSessionBySID(handle.get(), sessionId.c_str(), &found) == 1;
    record.reset(found);
    std::string user;
    if (!known) {
        SetErr(ERR::kSessionUserUnknown);
        return {};
    }
    if (!readField(record.get(), OVRA_CGI_FIELD_USER, user)) {
        SetErr(ERR::kSessionUserUnknown);
        OVRA_WARN("Failed to get username of cgi");
        return {};
    }
    SetErr(ERR::kNone);
    return user;
}

void NodeSession::DeleteAllNodeSession() {
    SetErr(ERR::kFailed);
    CgiHandle handle;
    const bool removed = OvraCgiRemoveSessionByFunc(handle.get(), isOtherApplication, nullptr) == 0;
    if (!removed) {
        // The log line keeps its original function name.
        OVRA_LOG_IN(OvraDRCore::LogLevel::kErr, "RemoveSessionByUser",
                    "Failed to remove all node session");
    }
    SetErr(removed ? ERR::kNone : ERR::kSessionNotRemoved);
    OVRA_WARN("Remove all sessions released by ovradrnode: [%s]", removed ? "success" : "failed");
}

} // namespace OvraDRNode
