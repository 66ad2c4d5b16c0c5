// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "handlers/auth.h"
#include "refusal_log.h"
#include "service/http_server.h"
#include "service/work_queue.h"
#include "session_uses.h"

#include <ovraplatform/api_registry.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/wire_form.h>

#include <json/value.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace Ovradrd {

/// The queues that calls run in.
struct WorkQueues {
    OvraService::WorkQueue outbound{16, {128, 64}};
    OvraService::WorkQueue twoWay{16, {128, 64}};
    OvraService::WorkQueue relay{8, {128, 64}};
    // Log-ins: each hashes a password, with 64 MiB and a tenth of a second. Those of clients that
    // logged in before do not wait for those of strangers.
    OvraService::WorkQueue login{2, {512, 64}};
    OvraService::WorkQueue knownLogin{1, {512, 64}};
    OvraService::WorkQueue watch{8, {16384, 16384}}; ///< our own questions to other nodes
    /// Reads calls, and runs those that answer from this machine alone. The last one, so that it
    /// ends first: its threads give jobs to the others.
    OvraService::WorkQueue quick{4, {1024, 512}};

    OvraService::WorkQueue &of(OvraPlatform::APIQueue queue);
};

/// The path of a call from arrival to reply: unseal, find the session, judge name and rights, only
/// then parse the parameters, choose the queue, run the handler, seal the reply.
class CallDispatcher {
public:
    /// Everything must outlive the dispatcher and the jobs in the queues.
    /// \param logsCalls  every call gets a line at level debug, and not only the refused ones
    CallDispatcher(const OvraPlatform::APIRegistry &registry, const OvraPlatform::SealKeyPair &keys,
                   OvraPlatform::ReplayGuard &guard, LoginApi &api, SessionUses &uses,
                   WorkQueues &queues, bool logsCalls = false);
    CallDispatcher(const CallDispatcher &) = delete;
    CallDispatcher &operator=(const CallDispatcher &) = delete;

    /// Carries out the call in `request`. Does not wait; thread-safe.
    void serve(OvraService::HttpRequest request, const OvraService::HttpServer::Answer &answer);

    /// Says of a call whose body is longer than a log-in's, by its beginning, whether the rest is
    /// worth having: api, version, method and session have to stand there. Does not wait;
    /// thread-safe.
    void judge(OvraService::HttpRequest beginning, const OvraService::HttpServer::Verdict &verdict);

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
    using Milliseconds = std::chrono::duration<double, std::milli>;

    void submit(OvraService::HttpRequest &&request, const OvraService::HttpServer::Answer &answer,
                std::function<void(Call &, std::string &body)> process);
    void open(Call &call, std::string &body);
    void openBeginning(Call &call, const std::string &beginning,
                       const OvraService::HttpServer::Verdict &verdict);
    [[nodiscard]] bool read(Call &call, std::string_view body) const;
    [[nodiscard]] bool unseal(Call &call);
    [[nodiscard]] bool admit(Call &call);
    [[nodiscard]] bool parse(Call &call) const;
    void route(Call call);
    OvraService::WorkQueue &loginQueue(const Call &call);
    void refuse(const Call &call) const;
    void run(const Call &call);
    void note(const Call &call, const Json::Value &reply, Milliseconds time);
    void noteRefusal(const Call &call, int code);

    const OvraPlatform::APIRegistry &registry_;
    const OvraPlatform::SealKeyPair &keys_;
    OvraPlatform::ReplayGuard &guard_;
    LoginApi &loginApi_;
    SessionUses &uses_;
    WorkQueues &queues_;
    const bool logsCalls_;
    RefusalLog refusals_;
    std::atomic<bool> stopping_ = false;
    std::atomic<bool> leaving_ = false;
};

} // namespace Ovradrd
