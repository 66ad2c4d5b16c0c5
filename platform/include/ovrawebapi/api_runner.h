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
    /// this process if it hosts the handlers, otherwise in the daemon, which serves only root and
    /// its own user. Waits 120 seconds at most. Thread-safe; never throws.
    /// \param params  an object or null
    /// \param out     receives the response document, also of a failed request; if the daemon
    ///                cannot be reached, one with error 100 that says why and what to do
    /// \return true if the appliance answered, whatever the answer says.
    bool Exec(Json::Value &out, const char *api, int version, const char *method,
              const Json::Value &params, const char *user);
};

class __attribute__((visibility("default"))) APIValidator {
public:
    /// 1 to 65535.
    static bool IsPort(const int &port);
};

} // namespace OVRA
