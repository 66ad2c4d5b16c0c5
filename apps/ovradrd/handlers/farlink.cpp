// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"

#include <ovraplatform/api_errors.h>
#include <ovraplatform/farlink.h>

namespace Ovradrd {

namespace {

Json::Value getFarlink(const FarlinkAgent &agent) {
    const auto settings =
        OvraPlatform::readFarlinkSettings().value_or(OvraPlatform::FarlinkSettings());
    Json::Value data(Json::objectValue);
    data["enabled"] = !settings.host.empty() && !settings.alias.empty();
    if (!data["enabled"].asBool()) {
        return OvraPlatform::apiSuccess(data);
    }
    const FarlinkAgent::Status status = agent.status();
    data["server_alias"] = settings.alias;
    data["connected"] = status.connected;
    if (status.connected) {
        data["port"] = status.port;
        data["expires"] = Json::Int64{status.expires};
    } else if (!status.problem.empty()) {
        data["problem"] = status.problem;
    }
    return OvraPlatform::apiSuccess(data);
}

} // namespace

void addFarlinkAPI(OvraPlatform::APIRegistry &registry, const FarlinkAgent &agent) {
    registry.add(
        "OVRA.Core.Farlink", 1, "get", OvraPlatform::APIRight::kLocal,
        OvraPlatform::APIQueue::kQuick,
        [&agent](const Json::Value & /*params*/, const OvraPlatform::APICaller & /*caller*/) {
            return getFarlink(agent);
        });
}

} // namespace Ovradrd
