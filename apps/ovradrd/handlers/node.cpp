// SPDX-License-Identifier: Apache-2.0
#include "handlers/handlers.h"
#include "handlers/params.h"
#include "handlers/words.h"
#include "timezone.h"
#include "version.h"

#include <ovradrcore/cache.h>
#include <ovradrcore/err_recorder.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>

#include <chrono>
#include <functional>
#include <map>
#include <string>

namespace Ovradrd {

namespace {

using OvraDRNode::BaseSender;
using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraPlatform::APICaller;
using OvraPlatform::apiError;
using OvraPlatform::apiSuccess;

constexpr std::size_t kMaxFacts = 32;
constexpr std::size_t kMaxFact = 64;
constexpr std::size_t kMaxEndpoints = 32;
/// After this time no further endpoint is probed, which may take 10 seconds each: callers wait 60
/// seconds for the answer.
constexpr std::chrono::seconds kProbeTime{45};

/// What callers may request besides the facts in every answer.
const std::map<std::string, std::function<Json::Value()>> &furtherFacts() {
    static const std::map<std::string, std::function<Json::Value()>> kFacts = {
        {"timezone", [] { return Json::Value(localTimezone()); }},
        {"version", [] { return Json::Value(kVersion); }},
        {"time", [] { return Json::Value(Json::Int64{OvraDRCore::Cache::Now()}); }},
    };
    return kFacts;
}

Json::Value info(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::vector<std::string> names = in.optionalTexts("additional", kMaxFacts, kMaxFact);
    if (!in.ok()) {
        return in.error();
    }
    const std::string nodeId = DRNode::getLocalNodeId();
    if (nodeId.empty()) {
        return apiError(OvraPlatform::APIError::kInternal,
                        "the node id cannot be read now: see the log of the appliance");
    }
    Json::Value data(Json::objectValue);
    data["node_id"] = nodeId;
    data["serial"] = DRNode::getLocalSerial();
    data["hostname"] = DRNode::getLocalHostName();
    if (in.has("additional")) {
        data["additional"] = Json::Value(Json::objectValue);
    }
    for (const std::string &name : names) {
        const auto fact = furtherFacts().find(name);
        if (fact != furtherFacts().end()) {
            data["additional"][name] = fact->second();
        }
    }
    return apiSuccess(data);
}

/// The right to this call is the answer.
Json::Value testPrivilege(const Json::Value & /*params*/, const APICaller & /*caller*/) {
    return apiSuccess();
}

/// The first of the endpoints that this node can reach.
Json::Value testConnection(const Json::Value &params, const APICaller & /*caller*/) {
    Params in(params);
    const std::vector<Conn> conns = in.conns("conns", kMaxEndpoints);
    if (!in.ok()) {
        return in.error();
    }
    const auto end = std::chrono::steady_clock::now() + kProbeTime;
    for (const Conn &conn : conns) {
        if (std::chrono::steady_clock::now() >= end) {
            return apiError(OvraDRCore::ERR::kNotConnectable,
                            "none of the first endpoints answered in time: name the reachable ones "
                            "first");
        }
        if (BaseSender::IsConnectable(conn)) {
            return apiSuccess(conn.toJson());
        }
    }
    return apiError(
        OvraDRCore::ERR::kNotConnectable,
        "this node reaches none of the endpoints: check addresses, ports and firewalls");
}

} // namespace

void addNodeAPI(OvraPlatform::APIRegistry &registry) {
    using OvraPlatform::APIQueue;
    using OvraPlatform::APIRight;
    registry.add(kNodeApi, 1, "info", APIRight::kSession, APIQueue::kQuick, info);
    registry.add(kNodeApi, 1, "test_privilege", APIRight::kPairing, APIQueue::kQuick,
                 testPrivilege);
    registry.add(kNodeApi, 1, "test_connection", APIRight::kPairing, APIQueue::kOutbound,
                 testConnection);
}

} // namespace Ovradrd
