// SPDX-License-Identifier: Apache-2.0
#pragma once

// Web-API runtime of the local appliance.

#include <json/value.h>

namespace OVRA {

class __attribute__((visibility("default"))) APIRunner {
public:
    APIRunner();
    ~APIRunner(); // NOLINT(performance-trivially-destructible): callers link to the symbol

    /// Runs a web-API request on the local appliance, as an administrator in the name of `user`: in
    /// this process when it hosts the handlers, otherwise in the daemon, which has to be asked by
    /// root or by its own user. Waits 120 seconds at most. Safe for threads; never throws.
    /// \param params  an object or null
    /// \param out     receives the response document, also of a request that failed; when the
    ///                daemon cannot be asked, one with error 100 that says why and what to do
    /// \return true when the appliance answered, whatever the answer says.
    bool Exec(Json::Value &out, const char *api, int version, const char *method,
              const Json::Value &params, const char *user);
};

class __attribute__((visibility("default"))) APIValidator {
public:
    /// 1 to 65535.
    static bool IsPort(const int &port);
};

} // namespace OVRA
