// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "handlers/auth.h"
#include "refusal_log.h"
#include "service/http_server.h"
#include "service/work_queue.h"

#include <ovraplatform/api_registry.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/wire_form.h>

#include <json/value.h>

#include <atomic>
#include <optional>
#include <string>

namespace Ovradrd {

/// The queues that calls run in.
struct WorkQueues {
    OvraService::WorkQueue quick{
        4, 512}; ///< reads calls, and runs those that answer from this machine alone
    OvraService::WorkQueue outbound{16, 64};
    OvraService::WorkQueue twoWay{16, 64};
    OvraService::WorkQueue relay{8, 64};
    OvraService::WorkQueue login{
        2, 64}; ///< log-ins: each hashes a password, with 64 MiB and a tenth of a second

    OvraService::WorkQueue &of(OvraPlatform::APIQueue queue);
};

/// The path of a call from arrival to reply: read, unseal, find the session and its rights, choose
/// the queue, run the handler, seal the reply.
class CallDispatcher {
public:
    /// Everything must outlive the dispatcher and the jobs in the queues.
    /// \param logsCalls  every call gets a line at level debug, and not only the refused ones
    CallDispatcher(const OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                   OvraPlatform::ReplayGuard &guard, LoginApi &api, WorkQueues &queues,
                   bool logsCalls = false);
    CallDispatcher(const CallDispatcher &) = delete;
    CallDispatcher &operator=(const CallDispatcher &) = delete;

    /// Carries out the call in `request`. Does not wait; thread-safe.
    void serve(OvraService::HttpRequest request, const OvraService::HttpServer::Answer &answer);

    /// Carries out the call of a local process, with an administrator's rights, and waits for its
    /// reply. Thread-safe.
    Json::Value serveLocal(const OvraPlatform::LocalCall &call);

    /// Writes what is due of the log lines of refused calls. Call it now and then.
    void tellRefusals() { refusals_.tell(); }

    /// From here on leaves remote calls for which there is no place without an answer: "too busy"
    /// would end the caller's search for another way.
    void beginStop() { stopping_ = true; }
    /// Stops waiting for local calls in progress; they are answered with a refusal.
    void leaveLocal() { leaving_ = true; }

private:
    struct Call;

    void open(Call &call, std::string &body);
    [[nodiscard]] bool unseal(Call &call);
    [[nodiscard]] bool admit(Call &call);
    void route(Call call);
    void login(Call call);
    void refuse(const Call &call) const;
    void run(const Call &call);
    void noteRefusal(const Call &call, int code);

    const OvraPlatform::APIRegistry &registry_;
    const OvraPlatform::SealKeyPair &keys_;
    OvraPlatform::ReplayGuard &guard_;
    LoginApi &loginApi_;
    WorkQueues &queues_;
    const bool logsCalls_;
    RefusalLog refusals_;
    std::atomic<bool> stopping_ = false;
    std::atomic<bool> leaving_ = false;
};

} // namespace Ovradrd
