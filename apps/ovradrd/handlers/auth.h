// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "login_throttle.h"

#include <ovraplatform/api_call.h>
#include <ovraplatform/api_registry.h>

#include <json/value.h>

#include <chrono>
#include <optional>
#include <string>

namespace Ovradrd {

/// "OVRA.Core.Auth": log-in and log-out. Keeps count of the failed log-ins.
class LoginApi {
public:
    /// The lifetime of a log-in's session, in seconds.
    static constexpr int kSessionTime = 1800;
    /// The application its sessions belong to.
    static constexpr char kApplication[] = "ovradrd";

    /// Whether the call is a log-in, which has its own queue because it hashes a password.
    static bool isLogin(const OvraPlatform::APICall &call);

    /// Asks for a log-in with these parameters from this address.
    /// \return how long it must wait; std::nullopt: refuse it.
    std::optional<std::chrono::milliseconds> admit(const Json::Value &params,
                                                   const std::string &address);
    /// The admitted log-in is not carried out after all.
    void withdraw(const Json::Value &params, const std::string &address);

    /// Registers the methods; the api must outlive the registry.
    void addTo(OvraPlatform::APIRegistry &registry);

private:
    Json::Value login(const Json::Value &params, const OvraPlatform::APICaller &caller);

    LoginThrottle throttle_;
};

} // namespace Ovradrd
