// SPDX-License-Identifier: Apache-2.0
#include "support/remote_node.h"

#include <ovradrcore/json.h>
#include <ovraplatform/peer_trust.h>

#include <unistd.h>

#include <algorithm>

namespace OvraTest {

RemoteNode::RemoteNode()
    : server({.tls = true})
    , daemon_("/tmp/remote_node.seal", [this](const OvraPlatform::WireCall &call) {
        return record(call.sid + " " + call.method, call.sid, call.method, call.params);
    }) {
    unlink("/tmp/remote_node.seal");
    server.answerWith([this](const Received &received) { return respond(received); });
}

void RemoteNode::trust() const {
    OvraPlatform::trustEndpoint("https", "127.0.0.1", port(), server.fingerprint());
}

std::optional<SealingDaemon::Reply> RemoteNode::prepared(const std::string &call) const {
    const std::lock_guard<std::mutex> lock(guard_);
    const auto found = answers_.find(call);
    return found == answers_.end() ? std::nullopt : std::optional(found->second);
}

Answer RemoteNode::respond(const Received &received) {
    const auto call = OvraPlatform::decodeForm(received.body);
    const bool ownKey = call && call->method == "getinfo" && prepared("getinfo");
    if (call && !ownKey) {
        return daemon_.answer(received);
    }
    const SealingDaemon::Reply reply =
        ownKey ? *prepared("getinfo") : record("probe", "", "probe", Json::Value());
    const auto *document = std::get_if<std::string>(&reply);
    return document != nullptr ? Answer::json(*document) : std::get<Answer>(reply);
}

/// Records the call and finds its answer.
SealingDaemon::Reply RemoteNode::record(const std::string &call, const std::string &sid,
                                        const std::string &method, const Json::Value &params) {
    std::function<void()> action;
    {
        const std::lock_guard<std::mutex> lock(guard_);
        calls_.push_back(call);
        params_[method] = params.isNull() ? "" : OvraDRCore::toString(params);
        if (const auto found = actions_.find(method); found != actions_.end()) {
            action = found->second;
        }
    }
    if (action) {
        action();
    }
    const auto ofSession = prepared(sid + " " + method);
    const auto ofAll = prepared(method);
    return ofSession ? *ofSession : ofAll.value_or(R"({"success":true})");
}

void RemoteNode::answer(const std::string &call, const SealingDaemon::Reply &reply) {
    const std::lock_guard<std::mutex> lock(guard_);
    answers_[call] = reply;
}

void RemoteNode::forgetAnswers() {
    const std::lock_guard<std::mutex> lock(guard_);
    answers_.clear();
}

void RemoteNode::before(const std::string &method, std::function<void()> action) {
    const std::lock_guard<std::mutex> lock(guard_);
    actions_[method] = std::move(action);
}

void RemoteNode::die() {
    server.refuse();
    server.closeConnections();
}

std::string RemoteNode::calls() const {
    const std::lock_guard<std::mutex> lock(guard_);
    std::string all;
    for (const std::string &call : calls_) {
        all += (all.empty() ? "" : ", ") + call;
    }
    return all;
}

long RemoteNode::count(const std::string &call) const {
    const std::lock_guard<std::mutex> lock(guard_);
    return std::count(calls_.begin(), calls_.end(), call);
}

void RemoteNode::forgetCalls() {
    const std::lock_guard<std::mutex> lock(guard_);
    calls_.clear();
}

std::string RemoteNode::params(const std::string &method) const {
    const std::lock_guard<std::mutex> lock(guard_);
    const auto found = params_.find(method);
    return found == params_.end() ? "" : found->second;
}

} // namespace OvraTest
