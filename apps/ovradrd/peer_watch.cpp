// SPDX-License-Identifier: Apache-2.0
#include "peer_watch.h"

#include <ovradrcore/json.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>

#include <algorithm>
#include <ctime>
#include <utility>
#include <vector>

namespace Ovradrd {

namespace {

namespace WebAPI = OvraDRNode::WebAPI;
using OvraApps::WayFacts;
using OvraDRCore::Response;
using OvraDRNode::CredNodeSender;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

/// Of two looks in a row the second finds nothing new to ask.
constexpr std::chrono::seconds kBetweenScans{2};

double wallClock() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch())
        .count();
}

/// When the session of a temporary credential ends, if the node says so.
void askForEnd(const DRNode &cred, CredNodeSender &sender, WayFacts &found) {
    const Response answer = sender.process(WebAPI::getDRNodeSessionGetAPI(cred.session));
    const Json::Value ends = answer.getDataField("expires");
    if (answer.isSuccess() && ends.isInt64()) {
        found.ends = ends.asInt64();
    }
}

/// Asks the node for its facts over the credential.
WayFacts askOver(const DRNode &cred, bool temporary) {
    WayFacts found;
    CredNodeSender sender(cred);
    // Afterwards the verdict is fresh, and the time is that of the request alone.
    found.answers = CredNodeSender::IsConnectable(cred);
    found.asked = std::time(nullptr);
    if (!found.answers) {
        found.code = OvraDRCore::ERR::kNotConnectable;
        return found;
    }
    const double begin = wallClock();
    const auto start = std::chrono::steady_clock::now();
    const Response answer =
        sender.process(WebAPI::getDRNodeInfoAPI({"timezone", "version", "time"}));
    const std::chrono::duration<double, std::milli> took = std::chrono::steady_clock::now() - start;
    const double middle = begin + took.count() / 2000;
    found.asked = std::time(nullptr);
    found.answers = answer.isValid();
    if (!answer.isSuccess()) {
        const OvraDRCore::ErrRecorder error = errorOf(sender, answer);
        const Json::Value &message = error.GetErrMsg();
        found.code = error.GetErrCode();
        found.reason =
            message.isString() ? message.asString() : OvraDRCore::memberString(message, "text");
        return found;
    }
    const Json::Value &data = answer.getData();
    const Json::Value additional =
        data.isObject() ? data.get("additional", Json::Value()) : Json::Value();
    found.latency = took.count();
    found.nodeId = OvraDRCore::memberString(data, "node_id");
    found.version = OvraDRCore::memberString(additional, "version");
    const Json::Value time =
        additional.isObject() ? additional.get("time", Json::Value()) : Json::Value();
    if (time.isInt64()) {
        found.clockAhead = static_cast<double>(time.asInt64()) / 1000 - middle;
    }
    if (found.nodeId == cred.nodeId) {
        (void)OvraDRNode::NodeCache(cred.nodeId, false).UpdateWithData(data);
    }
    // The right to know something is not the right to do something.
    const Response right = sender.process(WebAPI::getDRNodeTestPrivilegeAPI());
    if (right.isValid() && !right.isSuccess()) {
        found.code = errorOf(sender, right).GetErrCode();
    }
    if (temporary) {
        askForEnd(cred, sender, found);
    }
    return found;
}

} // namespace

void PeerWatch::wake() {
    {
        const std::lock_guard lock(mutex_);
        interestEnds_ = Clock::now() + kInterest;
    }
    round();
}

void PeerWatch::round() {
    {
        const std::lock_guard lock(mutex_);
        const auto now = Clock::now();
        if (scanning_ || now >= interestEnds_ || now < scanned_ + kBetweenScans) {
            return;
        }
        scanning_ = true;
        scanned_ = now;
    }
    const auto job = [this] {
        try {
            scan();
        } catch (...) {
            const std::lock_guard lock(mutex_);
            scanning_ = false;
            throw;
        }
    };
    if (!queue_.submit("", job)) {
        const std::lock_guard lock(mutex_);
        scanning_ = false;
    }
}

void PeerWatch::scan() {
    std::vector<DRNode> lasting;
    std::vector<DRNode> temporary;
    DRNodeDB::List(lasting, DRNodeDB::CRED_TYPE_NODE);
    DRNodeDB::List(temporary, DRNodeDB::CRED_TYPE_TEMP);
    const std::size_t count = lasting.size() + temporary.size();
    const std::chrono::seconds pause =
        std::max(kPause, std::chrono::seconds(count / kMostPerSecond));
    std::set<std::string> present;
    for (const std::vector<DRNode> *creds : {&lasting, &temporary}) {
        for (const DRNode &cred : *creds) {
            present.insert(cred.credId);
            if (!cred.isValid()) {
                continue;
            }
            {
                const std::lock_guard lock(mutex_);
                const auto asked = asked_.find(cred.credId);
                const bool due = asked == asked_.end() || Clock::now() >= asked->second + pause;
                if (!due || !underWay_.insert(cred.credId).second) {
                    continue;
                }
            }
            const bool isTemporary = creds == &temporary;
            if (!queue_.submit("", [this, cred, isTemporary] { ask(cred, isTemporary); })) {
                const std::lock_guard lock(mutex_);
                underWay_.erase(cred.credId);
            }
        }
    }
    const std::lock_guard lock(mutex_);
    const auto isGone = [&present](const auto &entry) { return present.count(entry.first) == 0; };
    std::erase_if(facts_, isGone);
    std::erase_if(asked_, isGone);
    scanning_ = false;
}

void PeerWatch::ask(const DRNode &cred, bool temporary) {
    try {
        note(cred.credId, askOver(cred, temporary));
    } catch (...) {
        const std::lock_guard lock(mutex_);
        underWay_.erase(cred.credId);
        throw;
    }
}

void PeerWatch::note(const std::string &credId, WayFacts found) {
    const std::lock_guard lock(mutex_);
    asked_[credId] = Clock::now();
    underWay_.erase(credId);
    const auto [before, isNew] = facts_.try_emplace(credId);
    found.since =
        isNew || before->second.answers != found.answers ? found.asked : before->second.since;
    found.lastSeen = found.answers ? found.asked : before->second.lastSeen;
    if (!found.answers || found.code != 0) {
        // What it said before still holds; how fast it was does not.
        found.version = found.version.empty() ? before->second.version : found.version;
        found.nodeId = found.nodeId.empty() ? before->second.nodeId : found.nodeId;
    }
    before->second = std::move(found);
}

std::map<std::string, WayFacts> PeerWatch::facts() const {
    const std::lock_guard lock(mutex_);
    return facts_;
}

} // namespace Ovradrd
