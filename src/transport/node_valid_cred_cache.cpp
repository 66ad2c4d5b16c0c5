// SPDX-License-Identifier: Apache-2.0
#include "transport/node_valid_cred_cache.h"

#include "ovradrnode/sender.h"
#include "paths.h"
#include "words.h"

namespace OvraDRNode {

namespace {

constexpr long kLifetime = 5; // seconds
constexpr int kReadAttempts = 3;

} // namespace

NodeValidCredCache::NodeValidCredCache(const std::string &nodeId_)
    : Cache(Path::kValidCredCache, "node_valid_cred_" + nodeId_, kLifetime, false, kReadAttempts)
    , nodeId(nodeId_) {}

NodeValidCredCache::~NodeValidCredCache() = default;

Json::Value NodeValidCredCache::GetInfo() const {
    Json::Value info(Json::objectValue);
    info[Word::kName] = "node cred cache";
    info[Word::kNodeId] = nodeId;
    return info;
}

std::string NodeValidCredCache::getStoredCredId() const {
    const Json::Value stored = GetCachedData();
    return stored.isString() ? stored.asString() : "";
}

bool NodeValidCredCache::GetUpdatedData(Json::Value &value) const {
    const std::string id = getStoredCredId();
    const bool stillGood = !id.empty() && CredNodeSender(id).testPrivilege();
    value = stillGood ? id : NodeSender(nodeId).getValidCredId();
    return true;
}

bool NodeValidCredCache::IsValid(const Json::Value &value) const {
    return value.isString();
}

bool NodeValidCredCache::IsUpdatedDataRequired() const {
    return true;
}

} // namespace OvraDRNode
