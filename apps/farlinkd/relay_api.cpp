// SPDX-License-Identifier: Apache-2.0
#include "relay_api.h"

#include <ovrabase/address.h>
#include <ovrabase/encoding.h>
#include <ovrabase/number.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/farlink.h>

#include <algorithm>
#include <ctime>
#include <functional>
#include <iterator>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

namespace Farlinkd {

namespace {

namespace APIError = OvraPlatform::APIError;
using OvraDRCore::memberString;
using OvraPlatform::apiError;
using OvraPlatform::apiSuccess;

constexpr std::size_t kMaxText = 256;
/// An appliance that has not polled for this long is gone; it polls again after each answer.
constexpr std::chrono::seconds kGoneAfter{15};
constexpr std::size_t kTokenBytes = 32;

Json::Value noSuchAlias() {
    return OvraPlatform::apiBadParameter("alias", "nobody has this alias: check how it is written");
}

Json::Value badAlias() {
    return OvraPlatform::apiBadParameter(
        "alias", "an alias has 3 to 63 lower-case letters, digits and inner hyphens");
}

Json::Value refusalOf(AliasRegistry::Refusal refusal) {
    switch (refusal) {
    case AliasRegistry::Refusal::kTaken:
        return apiError(APIError::kNoPermission,
                        "the alias belongs to another appliance: choose another one");
    case AliasRegistry::Refusal::kTooMany:
        return apiError(APIError::kNoPermission,
                        "this appliance has as many aliases as it may: release one");
    case AliasRegistry::Refusal::kFull:
        return apiError(APIError::kTooBusy, "the relay service has no alias left");
    case AliasRegistry::Refusal::kNotStored:
        break;
    }
    return apiError(APIError::kInternal, "the relay service cannot store the alias: see its log");
}

std::string tooMuchToDo() {
    return OvraDRCore::toString(
        apiError(APIError::kTooBusy, "the relay service has too much to do: try again later"));
}

std::string randomText() {
    std::array<unsigned char, kTokenBytes> bytes{};
    randombytes_buf(bytes.data(), bytes.size());
    return OvraBase::toBase64Url(bytes.data(), bytes.size());
}

/// Takes the same time wherever the two differ.
bool sameSecret(const std::string &a, const std::string &b) {
    return a.size() == b.size() && sodium_memcmp(a.data(), b.data(), a.size()) == 0;
}

/// The text of a parameter; "" if it is none, or too long to be one.
std::string textOf(const Json::Value &params, const char *name) {
    std::string text = memberString(params, name);
    return text.size() <= kMaxText ? text : std::string();
}

} // namespace

RelayApi::RelayApi(AliasRegistry &aliases, Settings settings, const Limits &limits)
    : settings_(std::move(settings))
    , limits_(limits)
    , aliases_(aliases)
    , calls_(limits.callsPerMinute, std::chrono::minutes(1))
    , proofs_(limits.proofsPerMinute, std::chrono::minutes(1))
    , newAliases_(limits.aliasesPerHour, std::chrono::hours(1)) {
    crypto_auth_keygen(secret_.data());
}

void RelayApi::connect(TunnelServer &tunnelServer) {
    const std::lock_guard lock(mutex_);
    tunnelServer_ = &tunnelServer;
    for (const Alias &alias : aliases_.list()) {
        (void)openPort(alias); // the log says why; the others are served
    }
}

bool RelayApi::openPort(const Alias &alias) {
    auto listener = OvraService::Listener::listen(settings_.address, alias.port);
    if (!listener) {
        OVRA_ERR("The alias [%s] cannot be reached: %s", alias.name.c_str(),
                 listener.error().text.c_str());
        return false;
    }
    tunnelServer_->open(alias.name, std::move(*listener));
    return true;
}

void RelayApi::serve(OvraService::HttpRequest request, const Answer &answer) {
    // std::function must be copyable.
    const auto held = std::make_shared<OvraService::HttpRequest>(std::move(request));
    const auto leave = [answer] { answer(tooMuchToDo()); };
    if (!queue_.submit(
            OvraBase::clientKey(held->address), [this, held, answer] { handle(*held, answer); },
            leave)) {
        leave();
    }
}

void RelayApi::stop() {
    const auto deadline = Clock::now() + std::chrono::seconds(2);
    queue_.stop(deadline);
    changes_.stop(deadline);
}

void RelayApi::handle(OvraService::HttpRequest &request, const Answer &answer) {
    const auto reply = [&answer](const Json::Value &document) {
        answer(OvraDRCore::toString(document));
    };
    auto call = OvraPlatform::decodeForm(request.body);
    if (!call) {
        return reply(apiError(APIError::kBadRequest, call.error()));
    }
    if (call->api != OvraPlatform::kFarlinkApi || call->version != 1) {
        return reply(apiError(APIError::kNoSuchAPI, "this is a relay service: it has no such API"));
    }
    constexpr std::string_view kMethods[] = {"lookup", "challenge", "wait", "enrol", "release"};
    if (std::find(std::begin(kMethods), std::end(kMethods), call->method) == std::end(kMethods)) {
        return reply(apiError(APIError::kNoSuchMethod, "the relay service has no such method"));
    }
    std::unique_lock lock(mutex_);
    if (!calls_.allow(request.address, Clock::now())) {
        return reply(
            apiError(APIError::kTooBusy, "too many calls from this address: wait a minute"));
    }
    lock.unlock();
    if (const auto fault = OvraPlatform::parseParams(*call);
        fault != OvraDRCore::JsonFault::kNone) {
        return reply(apiError(APIError::kBadRequest,
                              std::string("a parameter ") + OvraDRCore::describe(fault)));
    }
    const Json::Value &params = call->params;
    lock.lock();
    if (!OvraPlatform::isFarlinkAlias(memberString(params, "alias"))) {
        return reply(badAlias());
    }
    if (call->method == "lookup") {
        return reply(lookUp(params));
    }
    if (call->method == "challenge") {
        return reply(challenge(params, request.address));
    }
    if (call->method == "wait") {
        return wait(params, answer);
    }
    lock.unlock();
    std::function<Json::Value()> change;
    if (call->method == "enrol") {
        if (!isProved(params)) {
            OVRA_NOTICE("An attempt from [%s] to enrol [%s] proves no key", request.address.c_str(),
                        memberString(params, "alias").c_str());
            return reply(
                apiError(APIError::kNoPermission, "the proof of the key is not valid: try again"));
        }
        change = [this, params, address = request.address] { return enrol(params, address); };
    } else {
        change = [this, params] { return release(params); };
    }
    const auto leave = [answer] { answer(tooMuchToDo()); };
    if (!changes_.submit(
            OvraBase::clientKey(request.address),
            [change, answer] { answer(OvraDRCore::toString(change())); }, leave)) {
        leave();
    }
}

Json::Value RelayApi::lookUp(const Json::Value &params) {
    const std::string name = memberString(params, "alias");
    const auto alias = aliases_.find(name);
    if (!alias) {
        return noSuchAlias();
    }
    const auto agent = agents_.find(name);
    if (agent == agents_.end() || !isThere(agent->second)) {
        return apiError(APIError::kTooBusy,
                        "the appliance is not connected to the relay service now: check that it "
                        "runs and has a way out");
    }
    Json::Value data(Json::objectValue);
    data["port"] = alias->port;
    if (!settings_.host.empty()) {
        data["host"] = settings_.host;
    }
    return apiSuccess(data);
}

std::string RelayApi::challengeFor(const std::string &alias, const std::string &key,
                                   std::int64_t time) const {
    const std::string text = std::to_string(time) + " " + alias + " " + key;
    std::array<unsigned char, crypto_auth_BYTES> proof{};
    crypto_auth(proof.data(), reinterpret_cast<const unsigned char *>(text.data()), text.size(),
                secret_.data());
    return std::to_string(time) + "." + OvraBase::toBase64Url(proof.data(), proof.size());
}

bool RelayApi::isFresh(const std::string &challenge, const std::string &alias,
                       const std::string &key) const {
    const std::int64_t now = std::time(nullptr);
    const std::int64_t time =
        OvraBase::parseNumber<std::int64_t>(challenge.substr(0, challenge.find('.'))).value_or(0);
    return time <= now && now - time <= limits_.challenge.count() &&
           sameSecret(challenge, challengeFor(alias, key, time));
}

Json::Value RelayApi::challenge(const Json::Value &params, const std::string &address) {
    if (!proofs_.allow(address, Clock::now())) {
        return apiError(APIError::kTooBusy, "too many attempts from this address: wait a minute");
    }
    Json::Value data(Json::objectValue);
    data["challenge"] =
        challengeFor(memberString(params, "alias"), textOf(params, "key"), std::time(nullptr));
    return apiSuccess(data);
}

/// Whether the caller has the key: only such a call waits for the disk.
bool RelayApi::isProved(const Json::Value &params) const {
    const std::string name = memberString(params, "alias");
    const std::string key = textOf(params, "key");
    const std::string challenge = textOf(params, "challenge");
    return isFresh(challenge, name, key) &&
           OvraPlatform::verifyFarlink(key, name, challenge, textOf(params, "signature"));
}

/// In the thread of the changes, as release() and dropExpired().
Json::Value RelayApi::enrol(const Json::Value &params, const std::string &address) {
    const std::string name = memberString(params, "alias");
    const std::string key = textOf(params, "key");
    if (!aliases_.find(name) && !newAliases_.allow(address, Clock::now())) {
        return apiError(APIError::kTooBusy, "too many new aliases from this address: wait an hour");
    }
    const auto enrolled = aliases_.enrol(name, key, std::time(nullptr));
    if (!enrolled) {
        if (enrolled.error() == AliasRegistry::Refusal::kTaken) {
            OVRA_NOTICE("[%s] asked for the alias [%s] with another key than its owner's",
                        address.c_str(), name.c_str());
        }
        return refusalOf(enrolled.error());
    }
    const Alias &alias = enrolled->alias;
    std::unique_lock lock(mutex_);
    if (enrolled->isNew) {
        OVRA_NOTICE("[%s] took the alias [%s] at port [%d]", address.c_str(), name.c_str(),
                    alias.port);
        leave(name); // an owner whose time was over
        if (!openPort(alias)) {
            lock.unlock();
            (void)aliases_.release(name); // it says so itself in the log
            return apiError(APIError::kInternal,
                            "the port of the alias cannot be opened: the log of the service says "
                            "why");
        }
    }
    Agent &agent = agents_[name];
    if (agent.waiting) {
        agent.waiting(OvraDRCore::toString(apiError(APIError::kNoSession)));
    }
    // Waiting callers stay; it is present once it polls for them.
    agent.waiting = nullptr;
    agent.token = randomText();
    agent.seen = Clock::now() - kGoneAfter;
    Json::Value data(Json::objectValue);
    data["port"] = alias.port;
    data["tunnel_port"] = settings_.tunnelPort;
    data["token"] = agent.token;
    data["expires"] = Json::Int64{alias.expires};
    data["lease"] = Json::Int64{alias.expires - std::time(nullptr)};
    return apiSuccess(data);
}

/// The appliance whose token came with the call, or null.
RelayApi::Agent *RelayApi::agentOf(const Json::Value &params) {
    const auto found = agents_.find(memberString(params, "alias"));
    const bool ours =
        found != agents_.end() && sameSecret(found->second.token, textOf(params, "token"));
    return ours ? &found->second : nullptr;
}

bool RelayApi::isThere(const Agent &agent) const {
    return agent.waiting || Clock::now() - agent.seen < kGoneAfter;
}

/// Answers with all waiting callers.
void RelayApi::deliverCallers(Agent &agent, const Answer &answer) {
    Json::Value data(Json::objectValue);
    data["callers"] = Json::Value(Json::arrayValue);
    for (const Caller &caller : agent.callers) {
        data["callers"].append(caller.id);
    }
    agent.callers.clear();
    agent.seen = Clock::now();
    answer(OvraDRCore::toString(apiSuccess(data)));
}

void RelayApi::wait(const Json::Value &params, const Answer &answer) {
    Agent *const agent = agentOf(params);
    if (agent == nullptr) {
        answer(OvraDRCore::toString(
            apiError(APIError::kNoSession, "the token is not, or no longer, valid: enrol anew")));
        return;
    }
    if (agent->waiting) {
        // The connection of the earlier poll was lost.
        deliverCallers(*agent, std::exchange(agent->waiting, nullptr));
    }
    if (!agent->callers.empty()) {
        deliverCallers(*agent, answer);
        return;
    }
    agent->waiting = answer;
    agent->waitingSince = Clock::now();
}

Json::Value RelayApi::release(const Json::Value &params) {
    const std::string name = memberString(params, "alias");
    std::unique_lock lock(mutex_);
    if (agentOf(params) == nullptr) {
        return apiError(APIError::kNoSession, "the token is not, or no longer, valid: enrol anew");
    }
    lock.unlock();
    if (!aliases_.release(name)) {
        return apiError(APIError::kInternal,
                        "the relay service cannot store that the alias is free: see its log");
    }
    OVRA_NOTICE("The alias [%s] was given up", name.c_str());
    lock.lock();
    leave(name);
    return apiSuccess();
}

/// Forgets the appliance of an alias and ends its calls.
void RelayApi::leave(const std::string &alias) {
    const auto agent = agents_.find(alias);
    if (agent != agents_.end()) {
        if (agent->second.waiting) {
            agent->second.waiting(OvraDRCore::toString(apiError(APIError::kNoSession)));
        }
        agents_.erase(agent);
    }
    tunnelServer_->close(alias);
}

bool RelayApi::announce(const std::string &alias, const std::string &caller,
                        const std::string &client) {
    const std::lock_guard lock(mutex_);
    const auto found = agents_.find(alias);
    if (found == agents_.end() || !isThere(found->second) ||
        found->second.callers.size() >= limits_.callers) {
        return false;
    }
    Agent &agent = found->second;
    const auto ofClient =
        std::count_if(agent.callers.begin(), agent.callers.end(),
                      [&client](const Caller &each) { return each.client == client; });
    if (static_cast<std::size_t>(ofClient) >= limits_.callersOfOne) {
        return false; // also of those who hung up again: the appliance connects to each in vain
    }
    agent.callers.push_back({caller, client});
    if (agent.waiting) {
        deliverCallers(agent, std::exchange(agent.waiting, nullptr));
    }
    return true;
}

void RelayApi::dropExpired() {
    for (const Alias &alias : aliases_.dropExpired(std::time(nullptr))) {
        OVRA_NOTICE("The alias [%s] has expired", alias.name.c_str());
        const std::lock_guard lock(mutex_);
        leave(alias.name);
    }
    dropping_ = false;
}

void RelayApi::endOverdue() {
    {
        const std::lock_guard lock(mutex_);
        for (auto &[name, agent] : agents_) {
            if (agent.waiting && Clock::now() - agent.waitingSince >= limits_.hold) {
                deliverCallers(agent, std::exchange(agent.waiting, nullptr));
            }
        }
    }
    // One at a time: while the disk is slow they must not fill the queue.
    if (!dropping_.exchange(true) && !changes_.submit("", [this] { dropExpired(); })) {
        dropping_ = false;
    }
}

} // namespace Farlinkd
