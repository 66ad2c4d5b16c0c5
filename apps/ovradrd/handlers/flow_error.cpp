// SPDX-License-Identifier: Apache-2.0
#include "handlers/flow_error.h"

#include <ovraplatform/api_errors.h>
#include <ovraplatform/login_refusal.h>

namespace Ovradrd {

namespace {

namespace APIError = OvraPlatform::APIError;
namespace ERR = OvraDRCore::ERR;

} // namespace

Json::Value flowError(const OvraDRCore::ErrRecorder &flow, int otherwise) {
    const int recorded = flow.GetErrCode();
    if (recorded == APIError::kNoPermission || recorded == APIError::kNoSession) {
        return OvraPlatform::apiError(ERR::kNoPrivilege,
                                      "the other node refused the session: it is unknown, expired, "
                                      "or lacks the right");
    }
    const OvraPlatform::LoginRefusal refusal = OvraPlatform::lastLoginRefusal();
    if (recorded == ERR::kLoginFailed && refusal.code != 0) {
        return OvraPlatform::apiError(refusal.code, refusal.detail);
    }
    const int code = recorded == ERR::kNone ? otherwise : recorded;
    const Json::Value &message = flow.GetErrMsg();
    return OvraPlatform::apiError(code, message.isNull() ? ERR::ToString(code) : message);
}

} // namespace Ovradrd
