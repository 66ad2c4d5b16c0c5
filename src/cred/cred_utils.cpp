// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/cred_utils.h"

#include "ovradrnode/node_api.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/sender.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <vector>

namespace OvraDRNode::CredUtils {

using OvraDRCore::Response;
using OvraDRCore::SelectCommand;
using OvraDRCore::SqliteEqual;
using OvraDRCore::SqliteValueList;

namespace {

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

} // namespace

int GetSessionUsedCount(const std::string &session, const std::string &exceptCredId) {
    if (session.empty()) {
        OVRA_ERR("invalid session");
        return -1;
    }
    SelectCommand command;
    command.AddField(Word::kCredId);
    command.SetTable(NodeCredSqliteTable());
    command.SetCondition(SqliteEqual(Word::kSession, session));
    std::vector<SqliteValueList> rows;
    if (!NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        OVRA_ERR("Failed to select nodedb");
        return -1;
    }
    int count = 0;
    for (const SqliteValueList &row : rows) {
        std::string credId;
        const bool counts =
            row.GetValue(Word::kCredId, credId) && (exceptCredId.empty() || credId != exceptCredId);
        count += counts ? 1 : 0;
    }
    return count;
}

bool TestSessionValid(const Conn &conn, const std::string &session) {
    if (!conn.isValid() || session.empty()) {
        return false;
    }
    CredSessionSender sender(conn, session);
    return sender.process(WebAPI::getDRNodeTestPrivilegeAPI()).isSuccess();
}

bool NotifyRemoteNodeDeleteSessionIfNotUsed(const Conn &conn, const std::string &session) {
    if (session.empty()) {
        OVRA_ERR("Invalid session to notify remote delete");
        return false;
    }
    if (!conn.isValid()) {
        OVRA_ERR("Bad conn[%s] to notify delete session", text(conn).c_str());
        return false;
    }
    const int used = GetSessionUsedCount(session);
    if (used < 0) {
        OVRA_ERR("Failed to get reference count of session from db");
        return false;
    }
    if (used > 0) {
        OVRA_INFO("session is used by other cred, not notify remote to delete");
        return true;
    }
    CredSessionSender sender(conn, session);
    if (!sender.process(WebAPI::getDRNodeTestPrivilegeAPI()).isSuccess()) {
        OVRA_INFO("session has been invalid, no need to delete");
        return true;
    }
    const Response response = sender.process(WebAPI::getDRNodeSessionDeleteAPI(session));
    if (!response.isSuccess()) {
        OVRA_ERR("Failed to notify remote node delete session of conn[%s] with resp [%s]",
                 text(conn).c_str(), OvraDRCore::toLogString(response.toJson()).c_str());
        return false;
    }
    return true;
}

} // namespace OvraDRNode::CredUtils
