// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/err_recorder.h"

#include "ovradrcore/log.h"

namespace OvraDRCore {

namespace ERR {

std::string ToString(int code) {
    switch (code) {
    case kNone:
        return "no error";
    case kBadParameter:
        return "bad parameter";
    case kOutOfMemory:
        return "out of memory";
    case kNullSender:
        return "no sender";
    case kCredNotFound:
        return "credential not found";
    case kFailed:
        return "failed";
    case kNotConnectable:
        return "endpoint not connectable";
    case kLoginFailed:
        return "login failed";
    case kLoginDisabled:
        return "account disabled";
    case kLoginNotPermitted:
        return "login not permitted";
    case kLoginOtpRequired:
        return "one-time code required";
    case kLoginOtpWrong:
        return "one-time code wrong";
    case kCredItemRefused:
        return "credential item refused";
    case kUnknownNode:
        return "unknown node";
    case kCredIncomplete:
        return "credential not completed";
    case kSessionNotCreated:
        return "session not created";
    case kSessionNotRemoved:
        return "session not removed";
    case kCredInvalid:
        return "credential record invalid";
    case kOtherNode:
        return "belongs to another node";
    case kNodeInfoFailed:
        return "node information not obtained";
    case kCredCheckFailed:
        return "credential check failed";
    case kRemoteConnInvalid:
        return "endpoint chosen by the remote node invalid";
    case kLoginCallFailed:
        return "login call failed";
    case kCredLibrary:
        return "credential library error";
    case kNoPrivilege:
        return "no privilege";
    case kCertificateChanged:
        return "certificate not the trusted one";
    case kNoSuchUser:
        return "no such user";
    case kSessionUserUnknown:
        return "user of the session unknown";
    default:
        return "unknown error";
    }
}

} // namespace ERR

ErrRecorder::~ErrRecorder() = default;

Json::Value ErrRecorder::GetErr() const {
    Json::Value error;
    error["err_code"] = errCode_;
    const std::string text = GetErrCodeStr(errCode_);
    if (!text.empty()) {
        error["err_code_str"] = text;
    }
    if (!errMsg_.isNull()) {
        error["err_msg"] = errMsg_;
    }
    return error;
}

std::string ErrRecorder::GetErrCodeStr(int /*code*/) const {
    return {};
}

void ErrRecorder::SetErr(int code, const Json::Value &message) const {
    errCode_ = code;
    errMsg_ = message;
}

void ErrRecorder::SetErr(const ErrRecorder *other) const {
    if (other == nullptr) {
        OVRA_ERR("Null pointer");
        return;
    }
    errCode_ = other->errCode_;
    errMsg_ = other->errMsg_;
}

} // namespace OvraDRCore
