// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_create.h"

#include "ovradrnode/cred_utils.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/node_cache.h"
#include "ovradrnode/node_db.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovradrcore/util.h>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::InsertCommand;
using OvraDRCore::LogLevel;
using OvraDRCore::Request;
using OvraDRCore::Response;
using OvraDRCore::SqliteTableHandler;
using OvraDRCore::toLogString;

namespace {

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

/// The local node id identifies the local node's own record, so no credential may have it as its
/// id.
std::string generateCredId() {
    std::string id = OvraDRCore::GenerateUUID();
    while (DRNode::isLocalNodeId(id)) {
        id = OvraDRCore::GenerateUUID();
    }
    return id;
}

} // namespace

CredCreate::~CredCreate() {
    clearSender();
}

bool CredCreate::setConn(const Conn &conn) {
    if (!conn.isValid()) {
        OVRA_ERR("Invalid connection [%s]", text(conn).c_str());
        SetErr(ERR::kBadParameter, Word::kConn);
        return false;
    }
    if (!BaseSender::IsConnectable(conn)) {
        SetErr(ERR::kNotConnectable);
        OVRA_ERR("Connection Failed with conn[%s]", text(conn).c_str());
        return false;
    }
    if (!node.setConn(conn)) {
        OVRA_ERR("Invalid connection [%s]", text(conn).c_str());
        SetErr(ERR::kBadParameter, Word::kConn);
        return false;
    }
    return true;
}

bool CredCreate::setSender(BaseSender *newSender) {
    if (newSender == nullptr) {
        SetErr(ERR::kNullSender);
        OVRA_ERR("Null sender");
        return false;
    }
    clearSender();
    sender = newSender;
    return true;
}

bool CredCreate::setCredSender(BaseCredSender *newSender) {
    if (newSender == nullptr) {
        SetErr(ERR::kNullSender);
        OVRA_ERR("Null sender");
        return false;
    }
    if (!newSender->init()) {
        SetErr(newSender);
        OVRA_ERR("Failed to set sender of conn[%s]/account[%s] with error [%s]",
                 text(newSender->getConn()).c_str(), account.c_str(),
                 toLogString(GetErr()).c_str());
        delete newSender;
        return false;
    }
    if (!setSender(newSender)) {
        OVRA_ERR("Null sender");
        return false;
    }
    return true;
}

void CredCreate::clearSender() {
    delete sender;
    sender = nullptr;
}

bool CredCreate::setCredAccount(const std::string &newAccount) {
    if (newAccount.empty()) {
        SetErr(ERR::kBadParameter, Word::kAccount);
        return false;
    }
    account = newAccount;
    return true;
}

bool CredCreate::completes(bool done) {
    if (!done) {
        clearSender();
    }
    return done;
}

bool CredCreate::setCred(const Conn &conn, const std::string &newAccount,
                         const std::string &password, const std::string &otp) {
    if (!conn.isValid() || newAccount.empty() || password.empty()) {
        OVRA_ERR("Bad Parameter: conn[%s]/account[%s]/password", text(conn).c_str(),
                 newAccount.c_str());
        SetErr(ERR::kBadParameter);
        return false;
    }
    return completes(setConn(conn) && setCredAccount(newAccount) &&
                     setCredSender(new CredAccountSender(conn, newAccount, password, otp)));
}

bool CredCreate::setCred(const Conn &conn, const std::string &session) {
    if (!conn.isValid() || session.empty()) {
        OVRA_ERR("Bad Parameter: conn[%s]/session", text(conn).c_str());
        SetErr(ERR::kBadParameter);
        return false;
    }
    std::string foundAccount;
    return completes(setConn(conn) && setCredSender(new CredSessionSender(conn, session)) &&
                     queryCredAccountBySession(session, foundAccount) &&
                     setCredAccount(foundAccount));
}

bool CredCreate::setCred(const std::string &credId) {
    if (credId.empty()) {
        OVRA_ERR("Bad Parameter: credId[%s]", credId.c_str());
        SetErr(ERR::kBadParameter);
        return false;
    }
    DRNode record;
    if (!DRNodeDB::GetCred(credId, record)) {
        OVRA_ERR("Failed to get credId [%s]", credId.c_str());
        SetErr(ERR::kCredInvalid, credId);
        return false;
    }
    std::string foundAccount;
    return completes(setConn(record.conn) && setSender(new CredNodeSender(record)) &&
                     queryCredAccountBySession(record.session, foundAccount) &&
                     setCredAccount(foundAccount));
}

bool CredCreate::checkParameter() const {
    if (account.empty()) {
        SetErr(ERR::kBadParameter, Word::kAccount);
        OVRA_ERR("login account is empty");
        return false;
    }
    if (!node.conn.isValid()) {
        SetErr(ERR::kBadParameter, Word::kConn);
        OVRA_ERR("node [%s] is not initialized", OvraDRCore::toString(node.toJson()).c_str());
        return false;
    }
    // A failed setCred() can leave the object without a sender.
    if (sender == nullptr || !sender->isValid()) {
        SetErr(ERR::kCredCheckFailed);
        OVRA_ERR("sender [%s] is invalid", text(node.conn).c_str());
        return false;
    }
    return true;
}

bool CredCreate::check() const {
    if (!checkParameter()) {
        return false;
    }
    if (!checkCredAccount()) {
        OVRA_ERR("Failed to check cred account [%s]", account.c_str());
        return false;
    }
    return true;
}

bool CredCreate::checkCredAccount() const {
    return sendReq(WebAPI::OvraCoreUserGetAPI(account)).isSuccess();
}

Response CredCreate::sendReq(const Request &request) const {
    if (!request.isValid()) {
        OVRA_ERR("Invalid request");
        SetErr(ERR::kBadParameter);
        return {};
    }
    if (sender == nullptr) {
        OVRA_ERR("Invalid sender");
        SetErr(ERR::kCredCheckFailed);
        return {};
    }
    Response response = sender->process(request);
    if (sender->GetErrCode() != ERR::kNone) {
        OVRA_ERR("Failed to send req [%s] since sender[%s] with err[%s]",
                 toLogString(request.toJson()).c_str(), text(node.conn).c_str(),
                 toLogString(sender->GetErr()).c_str());
        SetErr(sender);
    } else if (!response.isSuccess()) {
        OVRA_ERR("Bad resp[%s] of req[%s]", toLogString(response.toJson()).c_str(),
                 toLogString(request.toJson()).c_str());
        SetErr(response.getErrCode());
    }
    return response;
}

bool CredCreate::getRemoteNodeInfo() {
    SetErr(ERR::kNodeInfoFailed);
    const Request request = WebAPI::getDRNodeInfoAPI({});
    const Response response = sendReq(request);
    if (!response.isSuccess()) {
        return false;
    }
    if (!response.hasDataField(Word::kSerial) || !response.hasDataField(Word::kNodeId)) {
        OVRA_ERR("Bad response [%s]/req[%s]", toLogString(response.toJson()).c_str(),
                 toLogString(request.toJson()).c_str());
        return false;
    }
    const std::string serial = response.getDataFieldtoStr(Word::kSerial);
    const std::string nodeId = response.getDataFieldtoStr(Word::kNodeId);
    if (serial.empty() || nodeId.empty()) {
        OVRA_ERR("Bad serial[%s] or nodeId [%s]", serial.c_str(), nodeId.c_str());
        return false;
    }
    const std::string credId = generateCredId();
    if (!node.setNodeId(nodeId) || !node.setCredId(credId)) {
        OVRA_ERR("Failed to set nodecred by nodeId[%s] and credId[%s]", nodeId.c_str(),
                 credId.c_str());
        return false;
    }
    SetErr(ERR::kNone);
    return true;
}

bool CredCreate::requestRemoteSession() {
    sessionError.SetErr(ERR::kNone);
    const Response response = sendReq(getSessionRequestAPI());
    if (!response.isSuccess()) {
        sessionError =
            sender == nullptr ? OvraDRCore::ErrRecorder(*this) : errorOf(*sender, response);
        return false;
    }
    if (!response.hasDataField(Word::kSession)) {
        OVRA_ERR("No session field in resp[%s]", toLogString(response.toJson()).c_str());
        return false;
    }
    const std::string session = response.getDataFieldtoStr(Word::kSession);
    if (session.empty()) {
        OVRA_ERR("Empty session field in resp[%s]", toLogString(response.toJson()).c_str());
        return false;
    }
    grantedSession = session;
    if (grantObserver) {
        grantObserver(session);
    }
    if (!CredUtils::TestSessionValid(node.conn, session)) {
        OVRA_ERR("Invalie session[%s] of conn[%s]", text(node.conn).c_str(), session.c_str());
        return false;
    }
    if (!node.setSession(session)) {
        OVRA_ERR("Bad session of host [%s]", node.conn.addr.c_str());
        return false;
    }
    return true;
}

bool CredCreate::queryCredAccountBySession(const std::string &session,
                                           std::string &foundAccount) const {
    SetErr(ERR::kFailed);
    if (session.empty()) {
        SetErr(ERR::kBadParameter, Word::kSession);
        return false;
    }
    const Response response = sendReq(WebAPI::getDRNodeSessionGetAPI(session));
    if (response.isSuccess() && response.hasDataField(Word::kAccount)) {
        foundAccount = response.getDataFieldtoStr(Word::kAccount);
        if (!foundAccount.empty()) {
            SetErr(ERR::kNone);
            return true;
        }
    }
    SetErr(ERR::kSessionUserUnknown);
    return false;
}

bool CredCreate::insertCredNodeRecord() {
    if (!node.isValid()) {
        SetErr(ERR::kBadParameter, "node");
        OVRA_ERR("Failed to insert invalid node[%s]", OvraDRCore::toString(node.toJson()).c_str());
        return false;
    }
    InsertCommand command;
    command.SetFieldValues(node.ToSqliteRecord());
    command.SetTable(getCredTableHandler());
    if (!NodeDBHandler::GetHandler().InsertRecord(command)) {
        SetErr(ERR::kCredNotFound);
        OVRA_ERR("Failed to insert record [%s]", command.ToLogStr().c_str());
        return false;
    }
    return true;
}

bool CredCreate::process() {
    if (!checkParameter()) {
        return false;
    }
    if (!getRemoteNodeInfo()) {
        OVRA_ERR("Failed to get info of node [%s]", node.conn.addr.c_str());
        return false;
    }
    return createFor(__func__);
}

bool CredCreate::isLocalNode() const {
    return DRNode::isLocalNodeId(node.nodeId);
}

bool CredCreate::processKnownNode() {
    if (!checkParameter()) {
        return false;
    }
    if (node.nodeId.empty() || node.credId.empty()) {
        SetErr(ERR::kNodeInfoFailed);
        OVRA_ERR("No node was met at [%s]", node.conn.addr.c_str());
        return false;
    }
    return createFor(__func__);
}

/// The creation, once the node is known.
/// \param function  the function name in the log lines
bool CredCreate::createFor(const char *function) {
    if (!requestRemoteSession()) {
        SetErr(ERR::kCredIncomplete);
        OVRA_LOG_IN(LogLevel::kErr, function, "Failed to request session of remote node [%s]",
                    node.conn.addr.c_str());
        return false;
    }
    if (!insertCredNodeRecord()) {
        OVRA_LOG_IN(LogLevel::kErr, function, "Failed to insert crednode to db");
        return false;
    }
    NodeCache(node.nodeId, true).Update();
    return true;
}

DRNodeCredCreate::~DRNodeCredCreate() = default;

Request DRNodeCredCreate::getSessionRequestAPI() const {
    return WebAPI::getDRNodeSessionCreateAPI(DRNode::getLocalNodeId());
}

SqliteTableHandler DRNodeCredCreate::getCredTableHandler() const {
    return NodeCredSqliteTable();
}

TempCredCreate::~TempCredCreate() = default;

Request TempCredCreate::getSessionRequestAPI() const {
    return WebAPI::getDRNodeSessionTempCreateAPI();
}

SqliteTableHandler TempCredCreate::getCredTableHandler() const {
    return TempCredSqliteTable();
}

} // namespace OvraDRNode
