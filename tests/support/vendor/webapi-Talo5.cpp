// SPDX-License-Identifier: Apache-2.0

// The local appliance's web API, answered by the test.

#include "stand_in.h"

#include <ovrawebapi/api_runner.h>

OvraVendor::WebApiLibrary &OvraVendor::webApiLibrary() {
    static WebApiLibrary library;
    return library;
}

namespace OVRA {

APIRunner::APIRunner() {
    OvraVendor::webApiLibrary().runners.obtained();
}

APIRunner::~APIRunner() {
    OvraVendor::webApiLibrary().runners.givenBack();
}

bool APIRunner::Exec(Json::Value &out, const char *api, int version, const char *method,
                     const Json::Value &params, const char *user) {
    const auto &answer = OvraVendor::webApiLibrary().answer;
    if (!answer) {
        out = Json::Value();
        out["success"] = false;
        out["error"]["code"] = 100;
        return false;
    }
    OvraVendor::Call call;
    call.api = api;
    call.method = method;
    call.version = version;
    call.params = params;
    out = answer(call, user);
    return true;
}

bool APIValidator::IsPort(const int &port) {
    return port >= 1 && port <= 65535;
}

} // namespace OVRA
