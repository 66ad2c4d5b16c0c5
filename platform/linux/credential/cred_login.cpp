// SPDX-License-Identifier: Apache-2.0
#include "credential/cred_objects.h"
#include "credential/device_token.h"
#include "http/web_call.h"
#include "ovraplatform/api_errors.h"
#include "ovraplatform/login_refusal.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovradrcore/response.h>

#include <chrono>
#include <exception>
#include <string>
#include <utility>

namespace OvraPlatform {

namespace {

thread_local CredError lastError = CredError::kNone;
thread_local LoginRefusal lastRefusal;

/// The codes that judge account, password and one-time code.
constexpr int kFirstLoginCode = 400;
constexpr int kLastLoginCode = 404;

LoginRefusal refusalOf(const Json::Value &document) {
    const OvraDRCore::Response response(document);
    const int code = response.getErrCode();
    const bool judged = code >= kFirstLoginCode && code <= kLastLoginCode;
    return response.isSuccess() || judged ? LoginRefusal()
                                          : LoginRefusal{code, response.getErrMsg()};
}

} // namespace

CredError lastLoginError() {
    return lastError;
}

LoginRefusal lastLoginRefusal() {
    return lastRefusal;
}

} // namespace OvraPlatform

namespace OVRA {

using OvraPlatform::CredError;
using OvraPlatform::CredExpected;
using OvraPlatform::WebReply;
using OvraPlatform::WireCall;

namespace {

constexpr char kAuthApi[] = "OVRA.Core.Auth";
/// The remote may slow a log-in down by some seconds, and hashes the password.
constexpr std::chrono::seconds kLoginTime{60};
constexpr std::chrono::seconds kLogoutTime{5};

WireCall authCall(const char *method) {
    WireCall call;
    call.api = kAuthApi;
    call.version = 1;
    call.method = method;
    return call;
}

/// The document used if there was no answer.
Json::Value noAnswer(CredError error) {
    Json::Value message(Json::objectValue);
    message["cred_error"] = static_cast<int>(error);
    message["text"] = OvraPlatform::credErrorText(static_cast<int>(error));
    return OvraPlatform::apiError(OvraPlatform::APIError::kInternal, message);
}

/// The reply document.
CredExpected<Json::Value> login(const OVRACred &cred, const std::string &otp, OVRACredSess &sess) {
    const auto endpoint = cred.endpoint();
    if (!endpoint || cred.account.empty() || cred.passwd.empty()) {
        return tl::unexpected(CredError::kBadArgument);
    }
    WireCall call = authCall("login");
    call.params["account"] = cred.account;
    call.params["passwd"] = cred.passwd.get();
    if (!otp.empty()) {
        call.params["otp_code"] = otp;
    }
    if (const auto device = OvraPlatform::deviceToken(*endpoint, cred.account); !device.empty()) {
        call.params["device_token"] = device.get();
    }
    OvraPlatform::WebCallOptions options{std::chrono::steady_clock::now() + kLoginTime};
    options.reuse = false;
    options.firstContact = true;
    return OvraPlatform::callWebAPI(*endpoint, call, options)
        .and_then([&sess](const WebReply &reply) -> CredExpected<Json::Value> {
            Json::Value document;
            const std::string sid = reply.response.getDataFieldtoStr("sid");
            const bool unusable =
                reply.response.isSuccess() &&
                (sid.empty() || OVRACredSessItemSetAccessToken(&sess, sid.c_str()) != 0);
            if (unusable || !OvraDRCore::fromString(document, reply.document)) {
                return tl::unexpected(CredError::kReplyBroken);
            }
            return document;
        });
}

/// Whether the other end confirms it.
CredExpected<bool> logout(const OVRACred &cred, const OVRACredSess &sess) {
    const auto endpoint = cred.endpoint();
    if (!endpoint) {
        return tl::unexpected(CredError::kBadArgument);
    }
    WireCall call = authCall("logout");
    call.sid = sess.token.get();
    return OvraPlatform::callWebAPI(*endpoint, call,
                                    {std::chrono::steady_clock::now() + kLogoutTime})
        .map([](const WebReply &reply) { return reply.response.isSuccess(); });
}

} // namespace

int CredRequestUtil::LoginWithOTP(OVRACred *cred, const std::string &otp, OVRACredSess *sess,
                                  Json::Value *out) {
    OvraPlatform::lastError = CredError::kBadArgument;
    if (cred == nullptr || sess == nullptr || out == nullptr) {
        return 0;
    }
    try {
        OvraPlatform::lastError = CredError::kOutOfMemory;
        OvraPlatform::lastRefusal = {};
        const auto document = login(*cred, otp, *sess);
        if (document) {
            OvraPlatform::lastRefusal = OvraPlatform::refusalOf(*document);
        }
        OvraPlatform::lastError = document ? CredError::kNone : document.error();
        *out = document ? *document : noAnswer(document.error());
        return document ? 1 : 0;
    } catch (const std::exception &failure) {
        OVRA_ERR("A log-in failed: [%s]", failure.what());
        return 0;
    }
}

int CredRequestUtil::Logout(OVRACred *cred, OVRACredSess *sess) {
    if (cred == nullptr || sess == nullptr || sess->token.empty()) {
        return 0;
    }
    bool confirmed = false;
    try {
        const auto ended = logout(*cred, *sess);
        confirmed = ended.value_or(false);
        if (!ended) {
            OVRA_NOTICE("A session could not be ended, it expires by itself: [%s]",
                        OvraPlatform::credErrorText(static_cast<int>(ended.error())));
        }
    } catch (const std::exception &failure) {
        OVRA_ERR("A log-out failed: [%s]", failure.what());
    }
    sess->token = OvraBase::Secret();
    return confirmed ? 1 : 0;
}

} // namespace OVRA
