// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"
#include "handlers/params.h"

#include <ovraplatform/account_store.h>
#include <ovraplatform/api_errors.h>

namespace Ovradrd {

namespace {

namespace APIError = OvraPlatform::APIError;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;

/// One's own account; any account for an administrator.
Json::Value getUser(const Json::Value &params, const APICaller &caller) {
    Params in(params);
    const std::string name = in.text("name", Params::kMaxAccount);
    if (!in.ok()) {
        return in.error();
    }
    if (name != caller.user && caller.role != OvraPlatform::Role::kAdministrator) {
        return apiError(APIError::kNoPermission,
                        "the account of somebody else: use an administrator's account");
    }
    OvraPlatform::AccountStore accounts;
    const auto account = accounts.find(name);
    if (!accounts.error().empty()) {
        return apiError(APIError::kInternal,
                        "the accounts cannot be read now: see the log of the appliance");
    }
    if (!account) {
        return OvraPlatform::apiBadParameter("name", "there is no such account: check the name");
    }
    Json::Value data(Json::objectValue);
    data["name"] = account->name;
    data["role"] = OvraPlatform::roleWord(account->role);
    data["administrator"] = account->isAdministrator();
    data["disabled"] = account->disabled;
    data["one_time_code"] = account->oneTimeCode;
    return OvraPlatform::apiSuccess(data);
}

} // namespace

void addUserAPI(OvraPlatform::APIRegistry &registry) {
    registry.add("OVRA.Core.User", 1, "get", OvraPlatform::APIRight::kSession,
                 OvraPlatform::APIQueue::kQuick, getUser);
}

} // namespace Ovradrd
