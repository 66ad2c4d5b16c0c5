// SPDX-License-Identifier: Apache-2.0
#include "shared/remote_session.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/response.h>
#include <ovradrcore/sqlite_command.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>

#include <algorithm>
#include <vector>

namespace OvraApps {

namespace {

constexpr const char *kCredIdColumn = "cred_id";

} // namespace

SessionAnswer askSession(const OvraDRNode::Conn &conn, const std::string &session) {
    OvraDRNode::CredSessionSender sender(conn, session);
    const OvraDRCore::Response response =
        sender.process(OvraDRNode::WebAPI::getDRNodeTestPrivilegeAPI());
    if (response.isSuccess()) {
        return {SessionState::kLive, 0, {}};
    }
    if (!response.isValid()) {
        const int code = sender.GetErrCode();
        // The endpoint, which comes with this code, is known to who asks.
        const bool bare = code == OvraDRCore::ERR::kNotConnectable;
        return {SessionState::kSilent, code == 0 ? response.getErrCode() : code,
                bare ? Json::Value() : sender.GetErrMsg()};
    }
    if (response.getErrCode() == OvraPlatform::APIError::kNoSession) {
        return {SessionState::kGone, 0, {}};
    }
    return {SessionState::kRefused, response.getErrCode(), response.getErrMsg()};
}

std::optional<int> countUsers(const std::string &session, const std::string &exceptCredId) {
    OvraDRCore::SelectCommand command;
    command.AddField(kCredIdColumn);
    command.SetTable(OvraDRNode::NodeCredSqliteTable());
    command.SetCondition(OvraDRCore::SqliteEqual("session", session));
    std::vector<OvraDRCore::SqliteValueList> rows;
    if (!OvraDRNode::NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
        return std::nullopt;
    }
    return static_cast<int>(std::count_if(
        rows.begin(), rows.end(), [&exceptCredId](const OvraDRCore::SqliteValueList &row) {
            std::string credId;
            return row.GetValue(kCredIdColumn, credId) && credId != exceptCredId;
        }));
}

} // namespace OvraApps
