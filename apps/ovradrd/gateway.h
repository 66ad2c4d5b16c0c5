// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "credential/sealed_box.h"
#include "credential/wire_form.h"
#include "handlers/auth.h"
#include "http_server.h"
#include "lanes.h"
#include "webapi/api_registry.h"
#include "webapi/local_wire.h"

#include <json/value.h>

#include <atomic>
#include <optional>
#include <string>

namespace Ovradrd {

/// The lanes that calls run in.
struct Lanes {
    Lane quick{4, 512}; ///< reads calls, and runs those that answer from this machine alone
    Lane slow{16, 64};  ///< calls that may wait on the network
    Lane login{2, 64};  ///< log-ins: each hashes a password, with 64 MiB and a tenth of a second
};

/// The way of a call from its arrival to its reply: read, unseal, find the session and its rights,
/// choose the lane, run the handler, seal the reply.
class Gateway {
public:
    /// Everything has to outlive the gateway and the jobs in the lanes.
    Gateway(const OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
            OvraPlatform::ReplayGuard &guard, LoginDesk &desk, Lanes &lanes);
    Gateway(const Gateway &) = delete;
    Gateway &operator=(const Gateway &) = delete;

    /// Carries out the call in `request`. Does not wait; safe for threads.
    void serve(HttpRequest request, const HttpServer::Answer &answer);

    /// Carries out the call of a local process, with an administrator's rights, and waits for its
    /// reply. Safe for threads.
    Json::Value serveLocal(const OvraPlatform::LocalCall &call);

    /// Nobody waits for local calls under way any more; they are answered with a refusal.
    void leaveLocal() { leaving_ = true; }

private:
    struct Call;

    void open(Call &call, std::string &body);
    bool unseal(Call &call);
    bool admit(Call &call);
    void route(Call call);
    void login(Call call);
    void run(const Call &call) const;

    const OvraPlatform::APIRegistry &registry_;
    const OvraPlatform::SealKeyPair &keys_;
    OvraPlatform::ReplayGuard &guard_;
    LoginDesk &desk_;
    Lanes &lanes_;
    std::atomic<bool> leaving_ = false;
};

} // namespace Ovradrd
