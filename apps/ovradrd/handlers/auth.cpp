// SPDX-License-Identifier: Apache-2.0
#include "handlers/auth.h"

#include "handlers/params.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/session_store.h>

#include <algorithm>

namespace Ovradrd {

namespace {

using OvraPlatform::AccountStore;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;
using OvraPlatform::LoginResult;
using OvraPlatform::SessionStore;

constexpr char kApi[] = "OVRA.Core.Auth";
constexpr int kApiVersion = 1;
constexpr char kLogin[] = "login";
constexpr char kLogout[] = "logout";
constexpr char kAccount[] = "account";
constexpr char kDeviceToken[] = "device_token";

const char *refusalText(LoginResult result) {
    switch (result) {
    case LoginResult::kWrong:
        return "no such account, or the password is wrong: check both";
    case LoginResult::kDisabled:
        return "the account is disabled: enable it, or use another";
    case LoginResult::kNotPermitted:
        return "the account may not log in over the network: permit it, or use another";
    case LoginResult::kCodeRequired:
        return "the account needs a one-time code: log in with the one that is valid now";
    case LoginResult::kCodeWrong:
        return "the one-time code is wrong or was used before: wait for the next one";
    default:
        return "the accounts cannot be read now: see the log of the appliance";
    }
}

/// The form for log lines: people sometimes type their password as the account.
std::string loggable(const std::string &account) {
    return AccountStore::isName(account) ? account : "(no account name)";
}

Json::Value openSession(const std::string &account, const APICaller &caller) {
    OvraPlatform::SessionRequest request;
    request.user = account;
    request.app = LoginApi::kApplication;
    request.remote = caller.address;
    request.timeout = LoginApi::kSessionTime;
    request.keepOthers = true;
    const auto sid = SessionStore().create(request);
    if (!sid) {
        return apiError(OvraPlatform::APIError::kInternal,
                        "the session cannot be made: see the log of the appliance");
    }
    Json::Value data(Json::objectValue);
    data["sid"] = *sid;
    return OvraPlatform::apiSuccess(data);
}

Json::Value logout(const Json::Value & /*params*/, const APICaller &caller) {
    if (caller.session.empty()) {
        return apiError(OvraPlatform::APIError::kNoSession, "a local caller has no session to end");
    }
    if (!SessionStore().remove(caller.session)) {
        return apiError(OvraPlatform::APIError::kInternal,
                        "the session cannot be ended: see the log of the appliance");
    }
    return OvraPlatform::apiSuccess();
}

} // namespace

bool LoginApi::isLogin(const OvraPlatform::APICall &call) {
    return call.api == kApi && call.version == kApiVersion && call.method == kLogin;
}

void LoginApi::noteRelay(const std::string &address) {
    const std::lock_guard lock(mutex_);
    if (std::find(relays_.begin(), relays_.end(), address) == relays_.end()) {
        relays_.resize(std::min(relays_.size(), kMaxRelays - 1));
        relays_.insert(relays_.begin(), address);
    }
}

/// "" for the relay's address.
std::string LoginApi::placeOf(const std::string &address) const {
    const std::lock_guard lock(mutex_);
    const bool relay = std::find(relays_.begin(), relays_.end(), address) != relays_.end();
    return relay ? std::string() : address;
}

bool LoginApi::isOfKnownClient(const Json::Value &params, const std::string &address) {
    const std::string account = OvraDRCore::memberString(params, kAccount);
    return AccountStore::isName(account) &&
           throttle_.knows(
               {account, placeOf(address), OvraDRCore::memberString(params, kDeviceToken)});
}

Json::Value LoginApi::login(const Json::Value &params, const APICaller &caller) {
    if (caller.local) {
        return apiError(OvraPlatform::APIError::kBadRequest, "a local caller needs no log-in");
    }
    Params in(params);
    const std::string account = in.text(kAccount, Params::kMaxAccount);
    const OvraBase::Secret password = in.secret("passwd", Params::kMaxPassword);
    const std::string code = in.optionalSecret("otp_code", Params::kMaxCode);
    const std::string device = in.optionalSecret(kDeviceToken, Params::kMaxDevice);
    if (!in.ok()) {
        return in.error();
    }
    const LoginThrottle::Login attempted{account, placeOf(caller.address), device};
    const auto attempt = throttle_.admit(attempted);
    if (!attempt) {
        return apiError(OvraPlatform::APIError::kTooBusy,
                        "too many log-ins failed, of this account or from your address: try again "
                        "in " +
                            std::to_string(attempt.error().count()) +
                            " seconds, or from where you logged in before");
    }
    const LoginResult result = AccountStore().verify(account, password.get(), code);
    switch (result) {
    case LoginResult::kOk:
        throttle_.recordSuccess(attempted, *attempt);
        OVRA_NOTICE("[%s] logged in from [%s]", account.c_str(), caller.address.c_str());
        return openSession(account, caller);
    case LoginResult::kWrong:
    case LoginResult::kCodeWrong:
        break;
    default:
        throttle_.withdraw(*attempt);
        break;
    }
    OVRA_NOTICE("A log-in of [%s] from [%s] was refused with [%d]", loggable(account).c_str(),
                caller.address.c_str(), static_cast<int>(result));
    return apiError(static_cast<int>(result), refusalText(result));
}

void LoginApi::addTo(OvraPlatform::APIRegistry &registry) {
    using OvraPlatform::APIQueue;
    using OvraPlatform::APIRight;
    registry.add(kApi, kApiVersion, kLogin, APIRight::kNone, APIQueue::kQuick,
                 [this](const Json::Value &params, const APICaller &caller) {
                     return login(params, caller);
                 });
    registry.add(kApi, kApiVersion, kLogout, APIRight::kSession, APIQueue::kQuick, logout);
}

} // namespace Ovradrd
