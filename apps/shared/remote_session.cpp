// SPDX-License-Identifier: Apache-2.0
#include "shared/remote_session.h"

#include "ovradrnode/node_api.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/sender.h"
#include "webapi/api_errors.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/response.h>
#include <ovradrcore/sqlite_command.h>

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
    const OvraDRCore::ErrRecorder error = errorOf(sender, response);
    if (!response.isValid()) {
        // The endpoint, which comes with this code, is known to who asks.
        const bool bare = error.GetErrCode() == OvraDRCore::ERR::kNotConnectable;
        return {SessionState::kSilent, error.GetErrCode(),
                bare ? Json::Value() : error.GetErrMsg()};
    }
    if (error.GetErrCode() == OvraPlatform::APIError::kNoSession) {
        return {SessionState::kGone, 0, {}};
    }
    return {SessionState::kRefused, error.GetErrCode(), error.GetErrMsg()};
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
