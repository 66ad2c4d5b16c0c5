// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "login_throttle.h"

#include <ovraplatform/api_registry.h>

#include <json/value.h>

namespace Ovradrd {

/// "OVRA.DR.Invite": a node takes up an invitation, which is a log-in without account and password.
/// Wrong secrets are guesses and have the budgets of those at log-in, each invitation like an
/// account of its own: who does not know its reference uses up none of it.
class InviteApi {
public:
    /// The lifetime of the session that is granted, in seconds: as long as a pairing takes.
    static constexpr int kSessionTime = 300;

    /// Registers the method; the api must outlive the registry.
    void addTo(OvraPlatform::APIRegistry &registry);

private:
    Json::Value redeem(const Json::Value &params, const OvraPlatform::APICaller &caller);

    LoginThrottle throttle_;
};

} // namespace Ovradrd
