// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/operation_dispatcher.h"

#include "ovradrnode/node_db.h"
#include "ovradrnode/sender.h"

#include <ovradrcore/log.h>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::Response;

NodeOperationDispatcher::NodeOperationDispatcher() = default;

NodeOperationDispatcher::NodeOperationDispatcher(const std::string &nodeId_)
    : nodeId(nodeId_) {}

NodeOperationDispatcher::~NodeOperationDispatcher() = default;

bool NodeOperationDispatcher::SetNodeId(const std::string &id) {
    nodeId = id;
    return true;
}

std::string NodeOperationDispatcher::GetCredId() const {
    return {};
}

bool NodeOperationDispatcher::IsLocalNode() const {
    return DRNode::isLocalNodeId(nodeId);
}

bool NodeOperationDispatcher::IsRemoteNode() const {
    return !nodeId.empty() && !DRNode::isLocalNodeId(nodeId);
}

bool NodeOperationDispatcher::HasPrivilege() const {
    return IsLocalNode() || DRNodeDB::IsNodeIdExist(nodeId) > 0;
}

bool NodeOperationDispatcher::Run() {
    if (!IsValidParam()) {
        OVRA_ERR("Bad Parameter");
        SetErr(ERR::kBadParameter);
        return false;
    }
    if (IsLocalNode()) {
        return RunLocal();
    }
    if (HasPrivilege()) {
        return RemoteRun();
    }
    OVRA_ERR("Runner [%s] is not privilege node", nodeId.c_str());
    SetErr(ERR::kUnknownNode);
    return false;
}

bool NodeOperationDispatcher::RemoteRun() {
    const std::string credId = GetCredId();
    return credId.empty() ? RunNodeSender() : RunCredNodeSender(credId);
}

/// The sender's code takes precedence over the remote's: callers compare it with the codes of this
/// library.
bool NodeOperationDispatcher::runOver(BaseSender &sender) {
    const Response response = sender.process(GetRequest());
    if (response.isSuccess()) {
        result = response.getData();
        return true;
    }
    if (sender.GetErrCode() != ERR::kNone) {
        SetErr(&sender);
    } else {
        SetErr(response.getErrCode(), response.getErrMsg());
    }
    return false;
}

bool NodeOperationDispatcher::RunNodeSender() {
    NodeSender sender(nodeId);
    return runOver(sender);
}

bool NodeOperationDispatcher::RunCredNodeSender(const std::string &credId) {
    DRNode node;
    if (!DRNodeDB::GetCred(credId, node)) {
        SetErr(ERR::kNodeInfoFailed);
        return false;
    }
    if (node.nodeId != nodeId) {
        SetErr(ERR::kOtherNode);
        return false;
    }
    CredNodeSender sender(node);
    return runOver(sender);
}

} // namespace OvraDRNode
