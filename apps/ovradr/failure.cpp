// SPDX-License-Identifier: Apache-2.0
#include "failure.h"

#include "access.h"
#include "endpoint.h"
#include "target.h"

#include <ovradrcore/json.h>
#include <ovradrcore/response.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/login_refusal.h>

#include <algorithm>
#include <array>
#include <cctype>

namespace Ovradr {

namespace {

/// The names of this program's own failures, in the order of the exit codes.
constexpr std::array kExitNames = {
    "ok",          "failed",    "usage",         "not_reachable", "login_refused", "one_time_code",
    "certificate", "not_found", "not_permitted", "not_set_up",    "name_unknown",  "no_appliance",
    "wrong_node",  "clock",
};

namespace ERR = OvraDRCore::ERR;
using OvraPlatform::CredError;
namespace APIError = OvraPlatform::APIError;

struct ErrorEntry {
    int code;
    ExitCode exit;
    const char *name;
    const char *message;
    const char *hint;
};

constexpr const char *kAdministrator =
    "Use an account of the other appliance with the role pairing or administrator.";
constexpr const char *kSameVersion = "Check that both appliances run versions that fit together.";
constexpr const char *kCheckName = "Check how it is written, and what the other appliance offers.";
constexpr const char *kPairAgain = "Make a new credential with `ovradr cred create`.";
constexpr const char *kLogInAgain = "Log in again with `ovradr cred set CRED_ID --account NAME`.";
constexpr const char *kSystemLog = "The system log says more.";

/// Everything that the library and the web API report by number.
constexpr std::array kErrors = {
    ErrorEntry{APIError::kInternal, ExitCode::kFailed, "internal",
               "The appliance could not carry out the request",
               "The system log of the appliance that was asked says why."},
    ErrorEntry{APIError::kBadRequest, ExitCode::kFailed, "bad_request",
               "The appliance does not understand the request", kSameVersion},
    ErrorEntry{APIError::kNoSuchAPI, ExitCode::kNotFound, "no_such_api",
               "The appliance has no such API", kCheckName},
    ErrorEntry{APIError::kNoSuchMethod, ExitCode::kNotFound, "no_such_method",
               "The API has no such method", kCheckName},
    ErrorEntry{APIError::kNoSuchVersion, ExitCode::kNotFound, "no_such_version",
               "The method has no such version", "Choose another one with --version."},
    ErrorEntry{APIError::kNoPermission, ExitCode::kNotPermitted, "no_permission",
               "The appliance does not permit this request", kAdministrator},
    ErrorEntry{APIError::kBadParameter, ExitCode::kFailed, "bad_parameter",
               "The appliance refused a parameter", "Correct it, or leave it out."},
    ErrorEntry{APIError::kTooBusy, ExitCode::kFailed, "too_busy",
               "The appliance is too busy and did nothing", "Try again in a moment."},
    ErrorEntry{APIError::kTooLarge, ExitCode::kFailed, "too_large",
               "The request or its answer is too large", "Ask for less at once."},
    ErrorEntry{APIError::kSealRefused, ExitCode::kFailed, "seal_refused",
               "The appliance did not accept the sealed request",
               "Try again; if that does not help, check the clocks of both appliances."},
    ErrorEntry{APIError::kNoSession, ExitCode::kLoginRefused, "no_session",
               "The appliance no longer knows the session of the credential", kLogInAgain},
    ErrorEntry{APIError::kLoginFailed, ExitCode::kLoginRefused, "login_failed",
               "The account or the password is wrong", "Check both and try again."},
    ErrorEntry{ERR::kBadParameter, ExitCode::kFailed, "bad_argument",
               "An argument is empty or not valid", "Correct it and try again."},
    ErrorEntry{ERR::kOutOfMemory, ExitCode::kFailed, "out_of_memory", "There is not enough memory",
               "Free some and try again."},
    ErrorEntry{ERR::kNullSender, ExitCode::kFailed, "no_sender", "The request has no sender",
               kSystemLog},
    ErrorEntry{ERR::kCredNotFound, ExitCode::kNotFound, "cred_not_found",
               "There is no such credential", "`ovradr cred list` shows those that there are."},
    ErrorEntry{ERR::kFailed, ExitCode::kFailed, "failed",
               "The operation failed, or its answer makes no sense", kSystemLog},
    ErrorEntry{ERR::kNotConnectable, ExitCode::kNotReachable, "not_connectable",
               "The other end does not answer",
               "`ovradr doctor`, with the node or its URL, says what is in the way."},
    ErrorEntry{ERR::kLoginFailed, ExitCode::kLoginRefused, "login_failed",
               "The log-in failed: the account or the password is wrong",
               "Check both; if they are right, the system log says what the other end answered."},
    ErrorEntry{ERR::kLoginDisabled, ExitCode::kLoginRefused, "login_disabled",
               "The account is disabled on the other appliance",
               "Have it enabled there, or use another account."},
    ErrorEntry{ERR::kLoginNotPermitted, ExitCode::kLoginRefused, "login_not_permitted",
               "The account may not log in to the other appliance over the network",
               "Use another account."},
    ErrorEntry{ERR::kLoginOtpRequired, ExitCode::kOneTimeCode, "otp_required",
               "The account needs a one-time code", "Give the present code with --otp."},
    ErrorEntry{ERR::kLoginOtpWrong, ExitCode::kOneTimeCode, "otp_wrong",
               "The one-time code is wrong",
               "Use the present code, each only once; check the clocks of both ends."},
    ErrorEntry{ERR::kCredItemRefused, ExitCode::kFailed, "item_refused",
               "The endpoint or the account cannot be used as it is written",
               "Check host, port and account name."},
    ErrorEntry{ERR::kUnknownNode, ExitCode::kNotFound, "unknown_node",
               "No credential reaches this node", kPairAgain},
    ErrorEntry{ERR::kCredIncomplete, ExitCode::kFailed, "cred_incomplete",
               "The other appliance granted no session that works", kAdministrator},
    ErrorEntry{ERR::kSessionNotCreated, ExitCode::kFailed, "session_not_created",
               "The session could not be made", kSystemLog},
    ErrorEntry{ERR::kSessionNotRemoved, ExitCode::kFailed, "session_not_removed",
               "The sessions could not be removed", kSystemLog},
    ErrorEntry{ERR::kCredInvalid, ExitCode::kNotFound, "cred_invalid",
               "The credential cannot be found or is not complete", kPairAgain},
    ErrorEntry{ERR::kOtherNode, ExitCode::kFailed, "other_node",
               "The credential belongs to another node", "`ovradr cred list` shows which."},
    ErrorEntry{ERR::kNodeInfoFailed, ExitCode::kFailed, "node_info_failed",
               "The other end does not say which node it is",
               "Check that the port is an appliance's, and that it is set up."},
    ErrorEntry{ERR::kCredCheckFailed, ExitCode::kFailed, "cred_check_failed",
               "The credential did not pass its check", kSystemLog},
    ErrorEntry{ERR::kRemoteConnInvalid, ExitCode::kNotReachable, "remote_conn_invalid",
               "The other appliance reaches none of the endpoints of this one",
               "`ovradr conn local` shows them; test one from there."},
    ErrorEntry{ERR::kLoginCallFailed, ExitCode::kNotReachable, "login_call_failed",
               "The log-in got no answer", "`ovradr doctor URL` says what is in the way."},
    ErrorEntry{ERR::kCredLibrary, ExitCode::kFailed, "request_failed", "The request failed",
               kSystemLog},
    ErrorEntry{ERR::kNoPrivilege, ExitCode::kNotPermitted, "no_privilege",
               "The other appliance does not permit this with this credential", kAdministrator},
    ErrorEntry{ERR::kCertificateChanged, ExitCode::kCertificate, "certificate_changed",
               "The key of the other end is not the one that was trusted for it",
               "Find out why it changed before you trust the new one."},
    ErrorEntry{ERR::kNoSuchUser, ExitCode::kNotFound, "no_such_user",
               "There is no such user on that appliance", "Check the name."},
    ErrorEntry{ERR::kSessionUserUnknown, ExitCode::kNotFound, "session_user_unknown",
               "The account of the session is not known", kLogInAgain},
};

std::string detailText(int code, const Json::Value &detail) {
    if (code == ERR::kCredLibrary && detail.isInt()) {
        return OvraPlatform::credErrorText(detail.asInt());
    }
    if (detail.isString()) {
        return detail.asString();
    }
    if (code == ERR::kNotConnectable && detail.isObject() && detail.isMember("addr")) {
        return targetText(OvraDRNode::Conn::fromJson(detail));
    }
    const std::string text = OvraDRCore::memberString(detail, "text");
    const std::string parameter = OvraDRCore::memberString(detail, "param");
    if (!text.empty()) {
        return text.starts_with(parameter) ? text : parameter + ": " + text;
    }
    return detail.isNull() ? std::string() : OvraDRCore::toLogString(detail);
}

/// Codes that need no detail: it would only repeat them.
bool saysItAll(int code) {
    return code == APIError::kNoSuchAPI || code == APIError::kNoSuchMethod ||
           code == APIError::kNoSuchVersion || code == APIError::kNoSession;
}

/// Our daemons and our credential library say what is wrong and, behind a colon, what to do. What
/// they say about a parameter is one piece.
bool hasAdvice(int code) {
    return (code < ERR::kBadParameter && code != APIError::kBadParameter) ||
           code == ERR::kCredLibrary;
}

std::string sentence(std::string text) {
    text.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(text.front())));
    return text.ends_with('.') ? text : text + ".";
}

void addDetail(Failure &found, const std::string &detail) {
    const std::size_t colon = hasAdvice(found.code) ? detail.rfind(": ") : std::string::npos;
    if (colon != std::string::npos && colon + 2 < detail.size()) {
        found.hint = sentence(detail.substr(colon + 2));
    }
    found.message += detail.empty() ? "." : " (" + detail.substr(0, colon) + ").";
}

} // namespace

Refusal failure(ExitCode exit, const std::string &message, const std::string &hint) {
    const int number = static_cast<int>(exit);
    return Refusal(Failure{
        exit, number, kExitNames.at(static_cast<std::size_t>(number)), message, hint, {}, {}});
}

ExitCode exitOf(CredError error) {
    switch (error) {
    case CredError::kBadArgument:
        return ExitCode::kUsage;
    case CredError::kNoPermission:
        return ExitCode::kNotPermitted;
    case CredError::kCannotConnect:
    case CredError::kConnectionLost:
    case CredError::kTimedOut:
    case CredError::kHttpStatus:
    case CredError::kReplyBroken:
    case CredError::kReplyTooLarge:
    case CredError::kTlsTooOld:
        return ExitCode::kNotReachable;
    case CredError::kCertificateChanged:
    case CredError::kNotTrusted:
        return ExitCode::kCertificate;
    case CredError::kTrustUnavailable:
    case CredError::kTrustLost:
        return ExitCode::kNotSetUp;
    default:
        return ExitCode::kFailed;
    }
}

Refusal storeFailure(ExitCode exit, const std::string &sentences) {
    if (auto allowed = checkUser(); !allowed) {
        return Refusal(allowed.error());
    }
    const std::size_t end = sentences.find(". ");
    return failure(exit, sentences.substr(0, end == std::string::npos ? end : end + 1),
                   end == std::string::npos ? "" : sentences.substr(end + 2));
}

Refusal failureOf(int code, const Json::Value &detail) {
    const auto *const entry =
        std::find_if(kErrors.begin(), kErrors.end(),
                     [code](const ErrorEntry &known) { return known.code == code; });
    Failure found{ExitCode::kFailed, code, "error_" + std::to_string(code),
                  "Error " + std::to_string(code), kSystemLog};
    if (entry != kErrors.end()) {
        found = {entry->exit, code, entry->name, entry->message, entry->hint};
    }
    if (code == ERR::kCredLibrary && detail.isInt()) {
        found.exit = exitOf(static_cast<CredError>(detail.asInt()));
    }
    addDetail(found, saysItAll(code) ? "" : detailText(code, detail));
    return Refusal(found);
}

Refusal failureOf(const OvraDRCore::ErrRecorder &error) {
    const OvraPlatform::CredError noReply = OvraPlatform::lastLoginError();
    if (error.GetErrCode() == ERR::kLoginFailed && noReply != OvraPlatform::CredError::kNone) {
        return failureOf(ERR::kCredLibrary, static_cast<int>(noReply));
    }
    const OvraPlatform::LoginRefusal refusal = OvraPlatform::lastLoginRefusal();
    if (error.GetErrCode() == ERR::kLoginFailed && refusal.code != 0) {
        return failureOf(refusal.code, refusal.detail);
    }
    return failureOf(error.GetErrCode(), error.GetErrMsg());
}

void nameEndpoint(Failure &failure, const OvraDRNode::Conn &conn) {
    static const std::string kAdvice = "ovradr conn trust";
    failure.message.insert(0, targetText(conn) + ": ");
    if (const std::size_t at = failure.hint.find(kAdvice); at != std::string::npos) {
        failure.hint.replace(at, kAdvice.size(), "`" + kAdvice + " " + targetText(conn) + "`");
    }
}

void addReason(Failure &failure, const OvraDRNode::Conn &conn) {
    const Expected<OvraDRNode::Conn> direct = directEndpoint(conn);
    if (conn.isValid() && direct) {
        const Failure why = whyNotReachable(*direct).value();
        failure.message = why.message;
        failure.hint = why.hint;
    }
}

} // namespace Ovradr
