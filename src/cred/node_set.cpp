// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_set.h"

#include "ovradrnode/cred_permission_cache.h"
#include "ovradrnode/cred_utils.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/node_cache.h"
#include "ovradrnode/node_db.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::Request;
using OvraDRCore::Response;
using OvraDRCore::SqliteEqual;
using OvraDRCore::toLogString;
using OvraDRCore::UpdateCommand;

namespace {

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

} // namespace

DRNodeCredSet::DRNodeCredSet(const std::string &credId) {
    (void)setCredId(credId); // its error is kept, and check() rejects an empty record
}

DRNodeCredSet::~DRNodeCredSet() = default;

bool DRNodeCredSet::setCredId(const std::string &credId) {
    SetErr(ERR::kFailed);
    if (credId.empty()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Invalid credId");
        return false;
    }
    if (!DRNodeDB::GetCred(credId, record)) {
        SetErr(ERR::kCredNotFound);
        OVRA_WARN("Failed to get cred of credId[%s]", credId.c_str());
        return false;
    }
    if (!record.isValid()) {
        SetErr(ERR::kCredInvalid);
        OVRA_ERR("Invalid cred [%s]", credId.c_str());
        return false;
    }
    SetErr(ERR::kNone);
    return true;
}

bool DRNodeCredSet::setCred(const Conn &conn, const std::string &account,
                            const std::string &password, const std::string &otp) {
    if (!BaseSender::IsConnectable(conn)) {
        SetErr(ERR::kNotConnectable);
        OVRA_ERR("Connection Failed with conn[%s]", text(conn).c_str());
        return false;
    }
    if (!sender.setConn(conn)) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Failed to set conn[%s]", text(conn).c_str());
        return false;
    }
    if (!sender.setCred(account, password, otp)) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Failed to set cred[%s]", account.c_str());
        return false;
    }
    if (!sender.init()) {
        SetErr(&sender);
        OVRA_ERR("Failed to init sender of conn [%s]/account[%s]", text(conn).c_str(),
                 account.c_str());
        return false;
    }
    return true;
}

bool DRNodeCredSet::IsSessionChanged() const {
    return !newSession.empty() && newSession != record.session;
}

bool DRNodeCredSet::check() {
    SetErr(ERR::kFailed);
    if (!record.isValid()) {
        SetErr(ERR::kCredInvalid);
        OVRA_ERR("Invalid credential [%s]", record.credId.c_str());
        return false;
    }
    if (!sender.isValid()) {
        SetErr(ERR::kCredCheckFailed);
        OVRA_ERR("sender [%s] is invalid", text(sender.getConn()).c_str());
        return false;
    }
    if (!checkRemoteNodeInfo()) {
        OVRA_ERR("Failed to check node info of remote node [%s]", record.conn.addr.c_str());
        return false;
    }
    SetErr(ERR::kNone);
    return true;
}

bool DRNodeCredSet::checkRemoteNodeInfo() {
    const Request request = WebAPI::getDRNodeInfoAPI({});
    const Response response = sender.process(request);
    if (sender.GetErrCode() != ERR::kNone) {
        SetErr(&sender);
        OVRA_ERR("Failed to get remote node info since sender error[%s]",
                 toLogString(sender.GetErr()).c_str());
        return false;
    }
    if (!response.isSuccess() || !response.hasDataField(Word::kSerial) ||
        !response.hasDataField(Word::kNodeId)) {
        SetErr(ERR::kNodeInfoFailed);
        OVRA_ERR("Bad response [%s]/req[%s]", toLogString(response.toJson()).c_str(),
                 toLogString(request.toJson()).c_str());
        return false;
    }
    const std::string serial = response.getDataFieldtoStr(Word::kSerial);
    const std::string nodeId = response.getDataFieldtoStr(Word::kNodeId);
    if (serial.empty() || nodeId.empty()) {
        SetErr(ERR::kOtherNode);
        OVRA_ERR("Bad serial[%s] or nodeId [%s]", serial.c_str(), nodeId.c_str());
        return false;
    }
    if (nodeId != record.nodeId) {
        SetErr(ERR::kOtherNode);
        OVRA_ERR("Different nodeId [%s] to setCred, [%s] is expected", nodeId.c_str(),
                 record.nodeId.c_str());
        return false;
    }
    return true;
}

bool DRNodeCredSet::requestRemoteSession() {
    const Request request = WebAPI::getDRNodeSessionCreateAPI(DRNode::getLocalNodeId());
    sessionError.SetErr(ERR::kNone);
    const Response response = sender.process(request);
    if (!response.isSuccess()) {
        sessionError = errorOf(sender, response);
        OVRA_ERR("Bad resp[%s]/req[%s] of host[%s]", toLogString(response.toJson()).c_str(),
                 toLogString(request.toJson()).c_str(), sender.getConn().addr.c_str());
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
    if (!CredUtils::TestSessionValid(sender.getConn(), session)) {
        OVRA_ERR("Invalie session of conn[%s]", text(sender.getConn()).c_str());
        return false;
    }
    newSession = session;
    return true;
}

bool DRNodeCredSet::setCredRecord() {
    const Conn &newConn = storedConn.isValid() ? storedConn : sender.getConn();
    if (record.conn == newConn && newSession == record.session) {
        // The log line uses this name for the node.
        OVRA_INFO("No change of conn or session of credId[%s]", record.nodeId.c_str());
        return true;
    }
    UpdateCommand command;
    command.SetTable(NodeCredSqliteTable());
    if (record.conn != newConn) {
        command.SetFieldValues(newConn.ToSqliteRecord());
    }
    if (newSession != record.session) {
        command.AddFieldValue(Word::kSession, newSession);
    }
    command.SetCondition(SqliteEqual(Word::kCredId, record.credId));
    if (!NodeDBHandler::GetHandler().UpdateRecord(command)) {
        SetErr(ERR::kCredNotFound);
        OVRA_ERR("Failed to update record by sql[%s]", command.ToLogStr().c_str());
        return false;
    }
    return true;
}

bool DRNodeCredSet::process() {
    SetErr(ERR::kFailed);
    if (!check()) {
        OVRA_ERR("Failed to test set credential of [%s]", record.credId.c_str());
        return false;
    }
    if (!requestRemoteSession()) {
        SetErr(ERR::kCredIncomplete);
        OVRA_ERR("Failed to request session of remote node [%s]", record.conn.addr.c_str());
        return false;
    }
    const Conn &conn = sender.getConn();
    if (!setCredRecord()) {
        if (IsSessionChanged()) {
            OVRA_ERR("Failed to set credId[%s], notify remote to delete new session",
                     record.credId.c_str());
            // The change has failed in any case; the outcome for the session is in the log.
            (void)CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(conn, newSession);
        }
        return false;
    }
    if (IsSessionChanged() &&
        !CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(conn, record.session)) {
        OVRA_WARN("Failed to notify remote [%s] to delete not used session", text(conn).c_str());
    }
    // Cached facts about the node and the right came over the old endpoint and session.
    CredPermissionCache(record.credId).Update();
    NodeCache(record.nodeId, true).Update();
    SetErr(ERR::kNone);
    return true;
}

} // namespace OvraDRNode
