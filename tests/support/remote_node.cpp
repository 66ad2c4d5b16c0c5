// SPDX-License-Identifier: Apache-2.0
#include "support/remote_node.h"

#include "ovradrcore/json.h"

#include <unistd.h>

namespace OvraTest {

namespace {

OvraPlatform::SealKeyPair makeKeys() {
    const std::string path = "/tmp/remote_node.seal";
    std::string why;
    const auto keys = OvraPlatform::SealKeyPair::loadOrCreate(path, why);
    unlink(path.c_str());
    return *keys;
}

} // namespace

RemoteNode::RemoteNode()
    : server({.tls = true})
    , keys_(makeKeys()) {
    server.answerWith([this](const Received &received) { return respond(received); });
}

RemoteNode::Prepared RemoteNode::prepared(const std::string &sid, const std::string &method) const {
    for (const std::string &key : {sid + " " + method, method}) {
        if (const auto found = answers_.find(key); found != answers_.end()) {
            return found->second;
        }
    }
    return {R"({"success":true})", {}, true};
}

bool RemoteNode::isPrepared(const std::string &call) const {
    const std::lock_guard<std::mutex> lock(guard_);
    return answers_.count(call) != 0;
}

Answer RemoteNode::respond(const Received &received) {
    std::string why;
    auto call = OvraPlatform::decodeForm(received.body, why);
    if (call && call->method == "getinfo" && !isPrepared("getinfo")) {
        return Answer::success(R"({"public_key":")" +
                               OvraPlatform::publicKeyText(keys_.publicKey()) + R"(","time":)" +
                               std::to_string(replays_.now()) + "}");
    }
    OvraPlatform::OpenedRequest opened;
    const bool sealed = call && !call->sealed.empty();
    if (sealed) {
        if (openRequest(keys_, *call, replays_, opened) != OvraPlatform::SealVerdict::kOpened) {
            return Answer::status(500);
        }
        *call = opened.call;
    }
    const std::string sid = call ? call->sid : "";
    const std::string method = call ? call->method : "probe";
    std::function<void()> action;
    {
        const std::lock_guard<std::mutex> lock(guard_);
        calls_.push_back(call ? sid + " " + method : method);
        params_[method] = call ? OvraDRCore::toString(call->params) : "";
        if (const auto found = actions_.find(method); found != actions_.end()) {
            action = found->second;
        }
    }
    if (action) {
        action();
    }
    const std::lock_guard<std::mutex> lock(guard_);
    const Prepared reply = prepared(sid, method);
    if (!reply.isDocument) {
        return reply.bytes;
    }
    return Answer::json(sealed ? sealReply(opened.replyKey, reply.document) : reply.document);
}

void RemoteNode::answer(const std::string &call, const std::string &document) {
    const std::lock_guard<std::mutex> lock(guard_);
    answers_[call] = {document, {}, true};
}

void RemoteNode::answer(const std::string &call, const Answer &answer) {
    const std::lock_guard<std::mutex> lock(guard_);
    answers_[call] = {{}, answer, false};
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
