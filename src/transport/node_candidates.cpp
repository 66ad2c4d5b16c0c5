// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_candidates.h"

#include "ovradrnode/cred_permission_cache.h"
#include "ovradrnode/node_db.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"
#include "words.h"

#include <algorithm>

namespace OvraDRNode {

namespace {

constexpr DRNodeDB::CredType kTables[] = {DRNodeDB::CRED_TYPE_NODE, DRNodeDB::CRED_TYPE_TEMP};

CachedVerdict verdictOf(const OvraDRCore::Cache &cache) {
    const Json::Value stored = cache.GetCachedData();
    CachedVerdict verdict;
    verdict.known = cache.IsValid(stored);
    if (verdict.known) {
        verdict.value = stored.asBool();
        verdict.age = cache.GetCachedAge();
        verdict.fresh = verdict.age >= 0 && verdict.age <= static_cast<double>(cache.GetLifetime());
    }
    return verdict;
}

Json::Value toJson(const CachedVerdict &verdict) {
    Json::Value json(Json::objectValue);
    json["known"] = verdict.known;
    json["value"] = verdict.value;
    json["fresh"] = verdict.fresh;
    json["age"] = verdict.age;
    return json;
}

const char *word(NodeCandidate::Outlook outlook) {
    switch (outlook) {
    case NodeCandidate::Outlook::kNext:
        return "next";
    case NodeCandidate::Outlook::kLater:
        return "later";
    case NodeCandidate::Outlook::kUnreachable:
        return "unreachable";
    case NodeCandidate::Outlook::kInvalid:
        return "invalid";
    }
    return "later";
}

NodeCandidate candidateOf(const DRNode &node, DRNodeDB::CredType type) {
    NodeCandidate candidate;
    candidate.node = node;
    candidate.temporary = type == DRNodeDB::CRED_TYPE_TEMP;
    candidate.reachable = verdictOf(ConnCache(node.conn));
    candidate.privilege = verdictOf(CredPermissionCache(node.credId));
    return candidate;
}

bool isDenied(const CachedVerdict &verdict) {
    return verdict.fresh && !verdict.value;
}

bool mayHaveRight(const NodeCandidate &candidate) {
    return candidate.node.isValid() && !isDenied(candidate.reachable) &&
           !isDenied(candidate.privilege);
}

/// The credential that a sender tries before it goes through the list; "" if there is none. A stale
/// remembered one counts only if it may still have the right, which the sender tests first; if it
/// has not, the sender picks the first lasting one that has.
std::string firstCredId(const NodeValidCredCache &cache,
                        const std::vector<NodeCandidate> &candidates) {
    const double age = cache.GetCachedAge();
    const bool fresh = age >= 0 && age <= static_cast<double>(cache.GetLifetime());
    std::string stored = cache.getStoredCredId();
    if (fresh) {
        return stored;
    }
    const auto found =
        std::find_if(candidates.begin(), candidates.end(), [](const NodeCandidate &candidate) {
            return candidate.remembered && mayHaveRight(candidate);
        });
    if (found != candidates.end()) {
        return stored;
    }
    const auto first =
        std::find_if(candidates.begin(), candidates.end(), [](const NodeCandidate &candidate) {
            return !candidate.temporary && mayHaveRight(candidate);
        });
    return first == candidates.end() ? std::string() : first->node.credId;
}

/// Says of the credentials of a node, in the order of the tables, how a request would use them, and
/// puts the one first that it begins with.
void judge(const std::string &nodeId, std::vector<NodeCandidate> &candidates) {
    const NodeValidCredCache cache(nodeId);
    const std::string remembered = cache.getStoredCredId();
    for (NodeCandidate &candidate : candidates) {
        candidate.remembered = !remembered.empty() && candidate.node.credId == remembered;
    }
    const std::string first = firstCredId(cache, candidates);
    std::stable_partition(
        candidates.begin(), candidates.end(),
        [&first](const NodeCandidate &candidate) { return candidate.node.credId == first; });
    bool nextFound = false;
    for (NodeCandidate &candidate : candidates) {
        if (!candidate.node.isValid()) {
            candidate.outlook = NodeCandidate::Outlook::kInvalid;
        } else if (isDenied(candidate.reachable)) {
            candidate.outlook = NodeCandidate::Outlook::kUnreachable;
        } else if (!nextFound) {
            candidate.outlook = NodeCandidate::Outlook::kNext;
            nextFound = true;
        }
    }
}

} // namespace

Json::Value NodeCandidate::toJson() const {
    Json::Value json(Json::objectValue);
    json[Word::kCredId] = node.credId;
    json["endpoint"] = node.conn.toJson();
    json["temporary"] = temporary;
    json["remembered"] = remembered;
    json["reachable"] = OvraDRNode::toJson(reachable);
    json["privilege"] = OvraDRNode::toJson(privilege);
    json["outlook"] = word(outlook);
    return json;
}

std::vector<NodeCandidate> listNodeCandidates(const std::string &nodeId) {
    std::vector<NodeCandidate> candidates;
    if (nodeId.empty() || DRNode::isLocalNodeId(nodeId)) {
        return candidates;
    }
    for (const DRNodeDB::CredType type : kTables) {
        std::vector<DRNode> nodes;
        DRNodeDB::ListCred(nodeId, nodes, type);
        for (const DRNode &node : nodes) {
            candidates.push_back(candidateOf(node, type));
        }
    }
    judge(nodeId, candidates);
    return candidates;
}

std::map<std::string, std::vector<NodeCandidate>> listAllNodeCandidates() {
    const OvraDRCore::CacheSnapshotScope snapshot;
    std::map<std::string, std::vector<NodeCandidate>> all;
    for (const DRNodeDB::CredType type : kTables) {
        std::vector<DRNode> nodes;
        DRNodeDB::List(nodes, type);
        for (const DRNode &node : nodes) {
            if (!node.nodeId.empty() && !DRNode::isLocalNodeId(node.nodeId)) {
                all[node.nodeId].push_back(candidateOf(node, type));
            }
        }
    }
    for (auto &[nodeId, candidates] : all) {
        judge(nodeId, candidates);
    }
    return all;
}

} // namespace OvraDRNode
