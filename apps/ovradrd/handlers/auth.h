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
    /// How long a session of a log-in lasts, in seconds.
    static constexpr int kSessionTime = 1800;
    /// The application that its sessions belong to.
    static constexpr char kApplication[] = "ovradrd";

    /// Whether the call is a log-in: it hashes a password, so it has a queue of its own.
    static bool isLogin(const OvraPlatform::APICall &call);

    /// Asks for a log-in with these parameters from this address.
    /// \return how long it must wait; nothing: refuse it.
    std::optional<std::chrono::milliseconds> admit(const Json::Value &params,
                                                   const std::string &address);
    /// The log-in that was admitted is not carried out after all.
    void forgive(const Json::Value &params, const std::string &address);

    /// Registers the methods; the api must outlive the registry.
    void addTo(OvraPlatform::APIRegistry &registry);

private:
    Json::Value login(const Json::Value &params, const OvraPlatform::APICaller &caller);

    LoginThrottle throttle_;
};

} // namespace Ovradrd
