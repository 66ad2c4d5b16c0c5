// SPDX-License-Identifier: Apache-2.0

// The local appliance's web API, answered by the test.

#include "stand_in.h"

#include <ovrawebapi/api_runner.h>

namespace OVRA {

APIRunner::APIRunner() {
    ++OvraVendor::webApiLibrary.runners;
}

APIRunner::~APIRunner() {
    --OvraVendor::webApiLibrary.runners;
}

bool APIRunner::Exec(Json::Value &out, const char *api, int version, const char *method,
                     const Json::Value &params, const char *user) {
    const auto &answer = OvraVendor::webApiLibrary.answer;
    if (!answer) {
        out = Json::Value();
        out["success"] = false;
        out["error"]["code"] = 100;
        return false;
    }
    out = answer({"", api, method, version, params}, user);
    return true;
}

bool APIValidator::IsPort(const int &port) {
    return port >= 1 && port <= 65535;
}

} // namespace OVRA
