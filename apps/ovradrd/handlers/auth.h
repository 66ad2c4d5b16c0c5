// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "login_throttle.h"

#include <ovraplatform/api_call.h>
#include <ovraplatform/api_registry.h>

#include <json/value.h>

#include <cstddef>
#include <mutex>
#include <string>
#include <vector>

namespace Ovradrd {

/// "OVRA.Core.Auth": log-in and log-out. Keeps count of the guesses.
class LoginApi {
public:
    /// The lifetime of a log-in's session, in seconds.
    static constexpr int kSessionTime = 1800;
    /// The application its sessions belong to.
    static constexpr char kApplication[] = "ovradrd";

    /// Whether the call is a log-in, which has its own queue because it hashes a password.
    static bool isLogin(const OvraPlatform::APICall &call);

    /// Reads which clients are known; before the first log-in.
    void recall() { throttle_.recall(); }
    /// Whether a log-in with these parameters, which may be anything, comes from a client that
    /// logged in to the account before. Thread-safe.
    bool isOfKnownClient(const Json::Value &params, const std::string &address);
    /// Everybody who calls through the relay has this address: no log-in makes it a known one.
    /// Thread-safe.
    void noteRelay(const std::string &address);

    /// Registers the methods; the api must outlive the registry.
    void addTo(OvraPlatform::APIRegistry &registry);

private:
    /// Of one relay service; the least recent one is forgotten.
    static constexpr std::size_t kMaxRelays = 16;

    std::string placeOf(const std::string &address) const;
    Json::Value login(const Json::Value &params, const OvraPlatform::APICaller &caller);

    LoginThrottle throttle_;
    mutable std::mutex mutex_;
    std::vector<std::string> relays_; ///< addresses of it, the newest first
};

} // namespace Ovradrd
