// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"
#include "webapi/api_errors.h"

namespace Ovradrd {

namespace {

Json::Value getFarlink(const Json::Value & /*params*/, const OvraPlatform::APICaller &caller) {
    if (!caller.local) {
        return OvraPlatform::apiError(OvraPlatform::APIError::kNoPermission,
                                      "the relay service is asked about on the appliance itself");
    }
    Json::Value data(Json::objectValue);
    data["enabled"] = false;
    return OvraPlatform::apiSuccess(data);
}

} // namespace

void addFarlinkAPI(OvraPlatform::APIRegistry &registry) {
    registry.add("OVRA.Core.Farlink", 1, "get", OvraPlatform::APIRight::kAdministrator,
                 OvraPlatform::APILane::kQuick, getFarlink);
}

} // namespace Ovradrd
