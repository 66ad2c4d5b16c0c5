// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/cred_reverse_create.h"

#include "ovradrnode/node_api.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/node_session.h"
#include "ovradrnode/sender.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::LogLevel;
using OvraDRCore::Request;
using OvraDRCore::Response;
using OvraDRCore::toLogString;

namespace {

/// The remote node probes, logs in and calls back within one call.
constexpr unsigned int kTempSessionLifetime = 300; // seconds

constexpr const char *kDirection = "unidirection";

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

} // namespace

CredReverseCreate::~CredReverseCreate() = default;

bool CredReverseCreate::setCredId(const std::string &credId) {
    if (credId.empty()) {
        OVRA_ERR("Invalid credid");
        return false;
    }
    if (!DRNodeDB::GetCred(credId, record)) {
        OVRA_ERR("Failed to get cred from credId[%s]", credId.c_str());
        return false;
    }
    return true;
}

bool CredReverseCreate::setLocalAccount(const std::string &account) {
    if (account.empty()) {
        OVRA_ERR("Bad cred account");
        return false;
    }
    localAccount = account;
    return true;
}

bool CredReverseCreate::addLocalConn(const Conn &conn) {
    if (!conn.isValid()) {
        OVRA_ERR("Invalid conn [%s] to add", text(conn).c_str());
        return false;
    }
    localConns.push_back(conn);
    return true;
}

bool CredReverseCreate::addLocalConns(const std::vector<Conn> &conns) {
    for (const Conn &conn : conns) {
        if (!addLocalConn(conn)) {
            return false;
        }
    }
    return true;
}

bool CredReverseCreate::checkParameter() const {
    if (localAccount.empty() || !record.isValid()) {
        OVRA_ERR("Invalid cred account [%s] or credId[%s]", localAccount.c_str(),
                 record.credId.c_str());
        SetErr(ERR::kBadParameter);
        return false;
    }
    if (localConns.empty()) {
        OVRA_ERR("Empty local connection to relay create to credId[%s]", record.credId.c_str());
        SetErr(ERR::kBadParameter);
        return false;
    }
    return true;
}

Response CredReverseCreate::sendReq(const Request &request) const {
    if (!request.isValid()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Invalid req");
        return {};
    }
    CredNodeSender sender(record);
    Response response = sender.process(request);
    if (sender.GetErrCode() != ERR::kNone) {
        OVRA_ERR("Failed to send api[%s] to [%s] since error[%s]",
                 toLogString(request.toJson()).c_str(), text(record.conn).c_str(),
                 toLogString(sender.GetErr()).c_str());
        SetErr(sender.GetErrCode());
    } else if (!response.isSuccess()) {
        SetErr(response.getErrCode(), response.getErrMsg());
        OVRA_ERR("Bad resp[%s] of req[%s]", toLogString(response.toJson()).c_str(),
                 toLogString(request.toJson()).c_str());
    }
    return response;
}

bool CredReverseCreate::testAvailableConn(Conn &conn) const {
    const Response response = sendReq(WebAPI::getDRNodeTestConnectionAPI(localConns));
    if (!response.isSuccess()) {
        return false;
    }
    conn = Conn::fromJson(response.getData());
    if (!conn.isValid()) {
        OVRA_ERR("Invalid connection [%s]", text(conn).c_str());
        SetErr(ERR::kRemoteConnInvalid);
        return false;
    }
    return true;
}

bool CredReverseCreate::relayCreate(const Conn &conn, const std::string &session) {
    const Response response = sendReq(WebAPI::getDRNodeCredCreateAPI(conn, session, kDirection));
    if (response.isSuccess()) {
        setCredInfo(response.getDataField("src_cred"));
    }
    return response.isSuccess();
}

/// Shared by check() and process(): step(conn, session) calls the remote node, with a local session
/// that exists for that time.
template <typename Step>
bool CredReverseCreate::withTempSession(const char *function, Step step) {
    SetErr(ERR::kNone);
    if (!checkParameter()) {
        return false;
    }
    Conn conn;
    if (!testAvailableConn(conn)) {
        OVRA_LOG_IN(LogLevel::kErr, function,
                    "Failed to test available connection to localhost for credId[%s]",
                    record.credId.c_str());
        return false;
    }
    NodeSession nodeSession;
    const std::string session = nodeSession.CreateTempSession(localAccount, kTempSessionLifetime);
    if (nodeSession.GetErrCode() != ERR::kNone) {
        OVRA_LOG_IN(LogLevel::kErr, function,
                    "Failed to create a temp session of account [%s] to remote site [%s]",
                    localAccount.c_str(), text(record.conn).c_str());
        SetErr(nodeSession.GetErrCode());
        return false;
    }
    step(function, conn, session);
    if (!session.empty()) {
        nodeSession.DeleteBySessionId(session);
    }
    // The result of the step does not count, only whether an error was recorded.
    return GetErrCode() == ERR::kNone;
}

bool CredReverseCreate::process() {
    const auto create = [this](const char *function, const Conn &conn, const std::string &session) {
        if (!relayCreate(conn, session)) {
            OVRA_LOG_IN(LogLevel::kErr, function,
                        "Failed to relay credId [%s] to create credential to local node",
                        record.credId.c_str());
        }
    };
    return withTempSession(__func__, create);
}

bool CredReverseCreate::check() {
    const auto test = [this](const char *function, const Conn &conn, const std::string &session) {
        if (!sendReq(WebAPI::getDRNodeTestCredCreateAPI(conn, localAccount, session)).isSuccess()) {
            OVRA_LOG_IN(LogLevel::kErr, function, "Failed to check create of credId[%s]",
                        record.credId.c_str());
        }
    };
    return withTempSession(__func__, test);
}

TempCredReverseCreate::~TempCredReverseCreate() = default;

bool TempCredReverseCreate::relayCreate(const Conn &conn, const std::string &session) {
    const Response response = sendReq(WebAPI::getDRNodeTempCredCreateAPI(conn, session));
    if (response.isSuccess()) {
        setCredInfo(response.getData());
    }
    return response.isSuccess();
}

} // namespace OvraDRNode
