// SPDX-License-Identifier: Apache-2.0
#include "call_dispatcher.h"

#include "session_owner.h"

#include <ovrabase/address.h>
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
constexpr std::string_view kSealedField = "sealed=";

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
    OvraPlatform::ReceivedCall wire;
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
                               OvraPlatform::ReplayGuard &guard, LoginApi &api, SessionUses &uses,
                               WorkQueues &queues, bool logsCalls)
    : registry_(registry)
    , keys_(keys)
    , guard_(guard)
    , loginApi_(api)
    , uses_(uses)
    , queues_(queues)
    , logsCalls_(logsCalls) {}

void CallDispatcher::serve(OvraService::HttpRequest request,
                           const OvraService::HttpServer::Answer &answer) {
    submit(std::move(request), answer, [this](Call &call, std::string &body) { open(call, body); });
}

void CallDispatcher::judge(OvraService::HttpRequest beginning,
                           const OvraService::HttpServer::Verdict &verdict) {
    submit(std::move(beginning), verdict, [this, verdict](Call &call, std::string &body) {
        openBeginning(call, body, verdict);
        OvraBase::wipe(body);
    });
}

/// Has what came from a client processed when it is its turn.
void CallDispatcher::submit(OvraService::HttpRequest &&request,
                            const OvraService::HttpServer::Answer &answer,
                            std::function<void(Call &, std::string &body)> process) {
    // std::function must be copyable.
    const auto held = std::make_shared<OvraService::HttpRequest>(std::move(request));
    const auto job = [held, answer, process = std::move(process)] {
        Call call;
        call.secure = held->secure;
        call.caller.address = held->address;
        call.answer = answer;
        process(call, held->body);
    };
    const auto leave = [this, held, answer] {
        OvraBase::wipe(held->body);
        Call call;
        call.answer = answer;
        refuse(call);
    };
    if (!queues_.quick.submit(OvraBase::clientKey(held->address), job, leave)) {
        leave();
    }
}

/// Reads the call and starts processing it.
void CallDispatcher::open(Call &call, std::string &body) {
    const bool readable = read(call, body);
    OvraBase::wipe(body);
    if (readable && unseal(call) && admit(call) && parse(call)) {
        route(std::move(call));
    }
}

void CallDispatcher::openBeginning(Call &call, const std::string &beginning,
                                   const OvraService::HttpServer::Verdict &verdict) {
    // The field after the last separator is not complete.
    const std::size_t end = beginning.rfind('&');
    const bool judgeable = call.secure && end != std::string::npos &&
                           beginning.compare(end + 1, kSealedField.size(), kSealedField) != 0;
    if (judgeable) {
        if (!read(call, std::string_view(beginning).substr(0, end)) || !admit(call)) {
            return;
        }
        if (!call.caller.user.empty()) {
            verdict(std::nullopt);
            return;
        }
    }
    call.reply(apiError(APIError::kTooLarge,
                        "a request of more than 16 KiB needs https, no seal, and first of all api, "
                        "version, method and a session: send less at once"));
}

/// Splits a body; false if it was refused.
bool CallDispatcher::read(Call &call, std::string_view body) const {
    auto wire = OvraPlatform::decodeForm(body);
    if (!wire) {
        call.reply(apiError(APIError::kBadRequest, wire.error()));
        return false;
    }
    if (wire->api.size() > kMaxName || wire->method.size() > kMaxName) {
        call.reply(apiError(APIError::kBadRequest, "the name of the API or method is too long"));
        return false;
    }
    call.wire = std::move(*wire);
    return true;
}

/// Replaces the visible call with the sealed one; false if it was refused.
bool CallDispatcher::unseal(Call &call) {
    const bool sealed = !call.wire.sealed.empty();
    if (!sealed) {
        const bool hasSomething = !call.wire.sid.empty() || !call.wire.texts.empty();
        if (hasSomething && !call.secure) {
            noteRefusal(call, APIError::kSealRefused);
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
        noteRefusal(call, APIError::kSealRefused);
        call.reply(OvraPlatform::sealRefusal(verdict, guard_.now()));
        return false;
    }
    static_cast<OvraPlatform::WireCall &>(call.wire) = std::move(opened.call);
    return true;
}

/// Identifies the caller, and judges the call by its name and the caller's rights; false if it was
/// refused. An unknown session counts as none.
bool CallDispatcher::admit(Call &call) {
    const SessionOwner owner =
        call.wire.sid.empty() ? SessionOwner{} : findSessionOwner(call.wire.sid);
    if (owner.state == SessionOwner::State::kNotKnown) {
        // A peer must not take the session for expired.
        call.reply(apiError(APIError::kInternal, "the sessions cannot be read now: see the log of "
                                                 "the appliance"));
        return false;
    }
    if (owner.state == SessionOwner::State::kFound) {
        if (owner.account.disabled) {
            noteRefusal(call, APIError::kNoPermission);
            call.reply(
                apiError(APIError::kNoPermission,
                         "the account of the session is disabled: enable it, or use another"));
            return false;
        }
        call.caller.user = owner.account.name;
        call.caller.role = owner.account.role;
        call.caller.session = call.wire.sid;
        uses_.note(call.wire.sid, call.caller.address);
    }
    if (const auto refused = registry_.refusal(call.wire, call.caller)) {
        note(call, *refused, {});
        call.reply(*refused);
        return false;
    }
    return true;
}

/// Parses the parameters; false if it was refused.
bool CallDispatcher::parse(Call &call) const {
    using OvraDRCore::JsonFault;
    const JsonFault fault = OvraPlatform::parseParams(call.wire);
    if (fault != JsonFault::kNone) {
        const bool isJson = fault != JsonFault::kNotJson;
        call.reply(apiError(isJson ? APIError::kTooLarge : APIError::kBadRequest,
                            std::string("a parameter ") + OvraDRCore::describe(fault) +
                                (isJson ? ": send less at once" : "")));
    }
    return fault == JsonFault::kNone;
}

void CallDispatcher::route(Call call) {
    OvraService::WorkQueue &queue =
        LoginApi::isLogin(call.wire) ? loginQueue(call) : queues_.of(registry_.queue(call.wire));
    if (&queue == &queues_.quick) {
        run(call);
        return;
    }
    const auto held = std::make_shared<Call>(std::move(call));
    const auto leave = [this, held] { refuse(*held); };
    if (!queue.submit(
            OvraBase::clientKey(held->caller.address), [this, held] { run(*held); }, leave)) {
        leave();
    }
}

OvraService::WorkQueue &CallDispatcher::loginQueue(const Call &call) {
    const bool known = loginApi_.isOfKnownClient(call.wire.params, call.caller.address);
    return known ? queues_.knownLogin : queues_.login;
}

/// There is no place for the call.
void CallDispatcher::refuse(const Call &call) const {
    if (!stopping_) {
        call.reply(busy());
    }
}

void CallDispatcher::noteRefusal(const Call &call, int code) {
    refusals_.note(call.caller.address, code,
                   "[" + call.wire.api + "] method [" + call.wire.method + "] of user [" +
                       call.caller.user + "]");
}

void CallDispatcher::run(const Call &call) {
    const OvraPlatform::ClientScope scope(call.caller.address);
    const Json::Value nothing;
    const OvraPlatform::PeerKeyScope peer(
        call.caller.role >= OvraPlatform::Role::kPairing ? call.wire.params : nothing);
    const auto begun = std::chrono::steady_clock::now();
    const Json::Value reply = registry_.dispatch(call.wire, call.caller);
    note(call, reply, std::chrono::steady_clock::now() - begun);
    call.reply(reply);
}

/// Logs a refusal and, if that is wanted, every call.
void CallDispatcher::note(const Call &call, const Json::Value &reply, Milliseconds time) {
    const int code = codeOf(reply);
    if (code == APIError::kNoPermission || code == APIError::kNoSession ||
        (code == APIError::kTooBusy && LoginApi::isLogin(call.wire))) {
        noteRefusal(call, code);
    }
    if (logsCalls_) {
        OVRA_DEBUG("[%s] version [%d] method [%s] of user [%s] from [%s]: code [%d] in [%.1f]ms",
                   call.wire.api.c_str(), call.wire.version, call.wire.method.c_str(),
                   call.caller.user.c_str(), call.caller.address.c_str(), code, time.count());
    }
}

Json::Value CallDispatcher::serveLocal(const OvraPlatform::LocalCall &call) {
    const auto promise = std::make_shared<std::promise<Json::Value>>();
    std::future<Json::Value> reply = promise->get_future();
    APICaller caller;
    caller.user = call.user;
    caller.role = OvraPlatform::Role::kAdministrator;
    caller.local = true;
    const auto run = [this, call, caller, promise] {
        // Without a client the session library would note one in the environment, which threads
        // must not change.
        const OvraPlatform::ClientScope scope(kLoopback);
        promise->set_value(registry_.dispatch(call, caller));
    };
    const auto leave = [promise] { promise->set_value(busy()); };
    if (!queues_.of(registry_.queue(call)).submit("", run, leave)) {
        leave();
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
