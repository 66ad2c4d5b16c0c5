// SPDX-License-Identifier: Apache-2.0
#include "call_dispatcher.h"

#include "session_owner.h"

#include <ovrabase/secret.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/client_scope.h>
#include <ovraplatform/peer_keys.h>

#include <chrono>
#include <future>
#include <memory>
#include <utility>

namespace Ovradrd {

namespace {

namespace APIError = OvraPlatform::APIError;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;
using OvraPlatform::APIQueue;

/// Of a reply; clients take 8 MiB, and sealing adds a third.
constexpr std::size_t kMaxReply = std::size_t{5} * 1024 * 1024;
constexpr std::size_t kMaxName = 128;
constexpr std::chrono::milliseconds kLocalPause{100};
constexpr char kLoopback[] = "127.0.0.1";

Json::Value busy() {
    return apiError(APIError::kTooBusy,
                    "the appliance has too much to do, nothing was done: try again later");
}

/// The refusal of a call that anybody on the way could read.
Json::Value unsealed(OvraPlatform::UnixMillis now) {
    Json::Value message(Json::objectValue);
    message["reason"] = "unsealed";
    message["time"] = Json::Int64{now};
    message["text"] = "over plain http parameters and session have to travel sealed: seal the "
                      "request, or use https; change a password that was sent like this";
    return apiError(APIError::kSealRefused, message);
}

int codeOf(const Json::Value &reply) {
    const Json::Value &code = reply["error"]["code"];
    return code.isInt() ? code.asInt() : 0;
}

} // namespace

OvraService::WorkQueue &WorkQueues::of(APIQueue queue) {
    switch (queue) {
    case APIQueue::kOutbound:
        return outbound;
    case APIQueue::kTwoWay:
        return twoWay;
    case APIQueue::kRelay:
        return relay;
    case APIQueue::kQuick:
        break;
    }
    return quick;
}

/// A call on its way, and where its reply goes.
struct CallDispatcher::Call {
    OvraPlatform::WireCall wire;
    std::optional<OvraPlatform::ReplyKey> replyKey;
    bool secure = false;
    APICaller caller;
    OvraService::HttpServer::Answer answer;

    /// Ends the call.
    void reply(const Json::Value &document) const {
        std::string text = OvraDRCore::toString(document);
        if (text.size() > kMaxReply) {
            text = OvraDRCore::toString(
                apiError(APIError::kTooLarge, "the reply is too large: ask for less at once"));
        }
        answer(replyKey ? OvraPlatform::sealReply(*replyKey, text) : std::move(text));
    }
};

CallDispatcher::CallDispatcher(const OvraPlatform::APIRegistry &registry,
                               const OvraPlatform::SealKeyPair &keys,
                               OvraPlatform::ReplayGuard &guard, LoginApi &api, WorkQueues &queues)
    : registry_(registry)
    , keys_(keys)
    , guard_(guard)
    , loginApi_(api)
    , queues_(queues) {}

void CallDispatcher::serve(OvraService::HttpRequest request,
                           const OvraService::HttpServer::Answer &answer) {
    // std::function must be copyable.
    const auto held = std::make_shared<OvraService::HttpRequest>(std::move(request));
    const bool taken = queues_.quick.submit([this, held, answer] {
        Call call;
        call.secure = held->secure;
        call.caller.address = held->address;
        call.answer = answer;
        open(call, held->body);
    });
    if (!taken) {
        OvraBase::wipe(held->body);
        Call call;
        call.answer = answer;
        refuse(call);
    }
}

/// Reads the call and starts processing it.
void CallDispatcher::open(Call &call, std::string &body) {
    auto wire = OvraPlatform::decodeForm(body);
    OvraBase::wipe(body);
    if (!wire) {
        call.reply(apiError(APIError::kBadRequest, wire.error()));
        return;
    }
    if (wire->api.size() > kMaxName || wire->method.size() > kMaxName) {
        call.reply(apiError(APIError::kBadRequest, "the name of the API or method is too long"));
        return;
    }
    call.wire = std::move(*wire);
    if (unseal(call) && admit(call)) {
        route(std::move(call));
    }
}

/// Replaces the visible call with the sealed one; false if it was refused.
bool CallDispatcher::unseal(Call &call) {
    const bool sealed = !call.wire.sealed.empty();
    if (!sealed) {
        const bool hasSomething = !call.wire.sid.empty() || !call.wire.params.empty();
        if (hasSomething && !call.secure) {
            call.reply(unsealed(guard_.now()));
            return false;
        }
        return true;
    }
    OvraPlatform::OpenedRequest opened;
    const OvraPlatform::SealVerdict verdict =
        OvraPlatform::openRequest(keys_, call.wire, guard_, opened);
    if (verdict != OvraPlatform::SealVerdict::kUnreadable) {
        call.replyKey = opened.replyKey;
    }
    if (verdict != OvraPlatform::SealVerdict::kOpened) {
        call.reply(OvraPlatform::sealRefusal(verdict, guard_.now()));
        return false;
    }
    call.wire = std::move(opened.call);
    return true;
}

/// Identifies the caller; false if it was refused. An unknown session counts as none.
bool CallDispatcher::admit(Call &call) {
    if (call.wire.sid.empty()) {
        return true;
    }
    const SessionOwner owner = findSessionOwner(call.wire.sid);
    if (owner.state == SessionOwner::State::kNotKnown) {
        // A peer must not take the session for expired.
        call.reply(apiError(APIError::kInternal, "the sessions cannot be read now: see the log of "
                                                 "the appliance"));
        return false;
    }
    if (owner.state == SessionOwner::State::kUnknown) {
        return true;
    }
    if (owner.account.disabled) {
        call.reply(apiError(APIError::kNoPermission,
                            "the account of the session is disabled: enable it, or use another"));
        return false;
    }
    call.caller.user = owner.account.name;
    call.caller.administrator = owner.account.administrator;
    call.caller.session = call.wire.sid;
    return true;
}

void CallDispatcher::route(Call call) {
    if (LoginApi::isLogin(call.wire)) {
        login(std::move(call));
        return;
    }
    const APIQueue queue = registry_.queue(call.wire);
    if (queue == APIQueue::kQuick) {
        run(call);
        return;
    }
    const auto held = std::make_shared<Call>(std::move(call));
    if (!queues_.of(queue).submit([this, held] { run(*held); })) {
        refuse(*held);
    }
}

void CallDispatcher::login(Call call) {
    const auto held = std::make_shared<Call>(std::move(call));
    const auto wait = loginApi_.admit(held->wire.params, held->caller.address);
    if (!wait) {
        held->reply(apiError(APIError::kTooBusy, "too many log-ins of this account or from this "
                                                 "address failed: wait a minute"));
        return;
    }
    if (!queues_.login.submit([this, held] { run(*held); }, *wait)) {
        loginApi_.withdraw(held->wire.params, held->caller.address);
        refuse(*held);
    }
}

/// There is no place for the call.
void CallDispatcher::refuse(const Call &call) const {
    if (!stopping_) {
        call.reply(busy());
    }
}

void CallDispatcher::run(const Call &call) const {
    const OvraPlatform::ClientScope scope(call.caller.address);
    const OvraPlatform::PeerKeyScope peer(call.caller.administrator ? call.wire.params
                                                                    : Json::Value());
    const auto begun = std::chrono::steady_clock::now();
    const Json::Value reply = registry_.dispatch(call.wire, call.caller);
    const std::chrono::duration<double, std::milli> time = std::chrono::steady_clock::now() - begun;
    OVRA_DEBUG("[%s] version [%d] method [%s] of user [%s] from [%s]: code [%d] in [%.1f]ms",
               call.wire.api.c_str(), call.wire.version, call.wire.method.c_str(),
               call.caller.user.c_str(), call.caller.address.c_str(), codeOf(reply), time.count());
    call.reply(reply);
}

Json::Value CallDispatcher::serveLocal(const OvraPlatform::LocalCall &call) {
    const auto promise = std::make_shared<std::promise<Json::Value>>();
    std::future<Json::Value> reply = promise->get_future();
    APICaller caller;
    caller.user = call.user;
    caller.administrator = true;
    caller.local = true;
    const bool taken =
        queues_.of(registry_.queue(call)).submit([this, call, caller, promise = promise] {
            // Without a client the session library would note one in the environment, which threads
            // must not change.
            const OvraPlatform::ClientScope scope(kLoopback);
            promise->set_value(registry_.dispatch(call, caller));
        });
    if (!taken) {
        return busy();
    }
    while (reply.wait_for(kLocalPause) != std::future_status::ready) {
        if (leaving_) {
            return apiError(APIError::kTooBusy, "the daemon stops: try again later");
        }
    }
    try {
        return reply.get();
    } catch (const std::future_error &) {
        return busy(); // the queue stopped before the job's turn came
    }
}

} // namespace Ovradrd
