// SPDX-License-Identifier: Apache-2.0
#include "shared/remote_session.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/response.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>

namespace OvraApps {

SessionAnswer askSession(const OvraDRNode::Conn &conn, const std::string &session) {
    OvraDRNode::CredSessionSender sender(conn, session);
    const OvraDRCore::Response response =
        sender.process(OvraDRNode::WebAPI::getDRNodeTestPrivilegeAPI());
    if (response.isSuccess()) {
        return {SessionState::kLive, 0, {}};
    }
    const OvraDRCore::ErrRecorder error = errorOf(sender, response);
    if (!response.isValid()) {
        // The endpoint, which comes with this code, is known to the caller.
        const bool bare = error.GetErrCode() == OvraDRCore::ERR::kNotConnectable;
        return {SessionState::kSilent, error.GetErrCode(),
                bare ? Json::Value() : error.GetErrMsg()};
    }
    if (error.GetErrCode() == OvraPlatform::APIError::kNoSession) {
        return {SessionState::kGone, 0, {}};
    }
    return {SessionState::kRefused, error.GetErrCode(), error.GetErrMsg()};
}

} // namespace OvraApps
