// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_cache.h"

#include "ovradrnode/dr_node.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/sender.h"
#include "paths.h"
#include "words.h"

#include <ovradrcore/json.h>

namespace OvraDRNode {

namespace {

constexpr long kLocalLifetime = 5;   // seconds
constexpr long kRemoteLifetime = 60; // seconds
constexpr int kReadAttempts = 3;

/// As old as the facts about a node are; nothing refreshes it.
class LearntCache : public OvraDRCore::Cache {
public:
    explicit LearntCache(const std::string &nodeId)
        : Cache(Path::kLearntCache, nodeId, kRemoteLifetime, false, kReadAttempts) {}

    Json::Value GetInfo() const override {
        Json::Value info(Json::objectValue);
        info[Word::kName] = "learnt cache";
        return info;
    }
    bool GetUpdatedData(Json::Value &) const override { return false; }
    bool IsValid(const Json::Value &) const override { return true; }
};

} // namespace

NodeCache::NodeCache(const std::string &nodeId_, bool flag)
    : Cache(Path::kNodeCache, nodeId_,
            DRNode::isLocalNodeId(nodeId_) ? kLocalLifetime : kRemoteLifetime,
            flag || DRNode::isLocalNodeId(nodeId_), kReadAttempts)
    , nodeId(nodeId_) {}

NodeCache::~NodeCache() = default;

Json::Value NodeCache::GetInfo() const {
    Json::Value info(Json::objectValue);
    info[Word::kName] = "node cache";
    info[Word::kNodeId] = nodeId;
    return info;
}

bool NodeCache::IsValid(const Json::Value &value) const {
    if (!DRNode::isLocalNodeId(nodeId)) {
        return true;
    }
    return value.isObject() && value.isMember(Word::kHostName) && value.isMember(Word::kSerial) &&
           value[Word::kAdditional].isObject() &&
           value[Word::kAdditional].isMember(Word::kTimeZone);
}

bool NodeCache::GetUpdatedData(Json::Value &value) const {
    NodeSender sender(nodeId);
    const OvraDRCore::Response response =
        sender.process(WebAPI::getDRNodeInfoAPI({Word::kTimeZone}));
    if (sender.GetErrCode() != OvraDRCore::ERR::kNone) {
        // Unreachable: the last known facts are the best available.
        value = GetCachedData();
        return true;
    }
    if (response.isSuccess()) {
        value = response.getData();
        LearntCache(nodeId).UpdateWithData(true);
    }
    return response.isSuccess();
}

double NodeCache::GetLearntAge() const {
    return LearntCache(nodeId).GetCachedAge();
}

bool NodeCache::Learn(const Json::Value &facts) const {
    return UpdateWithData(facts) && LearntCache(nodeId).UpdateWithData(true);
}

std::string NodeCache::GetHostName() const {
    return OvraDRCore::memberString(Read(), Word::kHostName);
}

std::string NodeCache::GetSerialNum() const {
    return OvraDRCore::memberString(Read(), Word::kSerial);
}

std::string NodeCache::GetTimeZone() const {
    const Json::Value info = Read();
    return info.isObject() ? OvraDRCore::memberString(info[Word::kAdditional], Word::kTimeZone)
                           : "";
}

} // namespace OvraDRNode
