// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "sender"

// Senders to a node: which credential is used, and what is recorded from the answer.

#include "library_errors.h"
#include "ovradrnode/cred_permission_cache.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/sender.h"
#include "transport/conn_cache.h"
#include "transport/node_valid_cred_cache.h"
#include "transport/request_scope.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <vector>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::Request;
using OvraDRCore::Response;

namespace {

constexpr int kRemoteNoPermission = 105;
constexpr DRNodeDB::CredType kAllCreds = DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP;

bool isNoPermission(const Response &response) {
    return response.isValid() && !response.isSuccess() &&
           response.getErrCode() == kRemoteNoPermission;
}

/// The remote answered the request itself, with success or an error; another credential would get
/// the same answer.
bool hasGotThrough(const Response &response) {
    return response.isValid() && !isNoPermission(response);
}

/// Whether an attempt failed with this number of those that are only passed on.
bool failedWith(const OvraDRCore::ErrRecorder &attempt, int libraryError) {
    return attempt.GetErrCode() == ERR::kCredLibrary && attempt.GetErrMsg() == libraryError;
}

/// Whether the request may have been carried out although no answer came.
bool mayHaveArrived(const OvraDRCore::ErrRecorder &attempt) {
    return failedWith(attempt, LibraryError::kConnectionLost) ||
           failedWith(attempt, LibraryError::kUnanswered);
}

/// Whether a relay endpoint is known not to answer, so that the relay service need not be asked
/// where it is; the sender itself looks at all others.
bool isHeldUnreachable(const Conn &conn) {
    return conn.isFarlink() &&
           (RequestScope::isUnreachable(conn) || ConnCache(conn).isHeldUnreachable());
}

bool isLocal(const DRNode &node) {
    return DRNode::isLocalNodeId(node.nodeId) || DRNode::isLocalNodeId(node.credId);
}

} // namespace

NodeSender::NodeSender(const std::string &nodeId_) {
    (void)setNode(nodeId_); // see isValid()
}

NodeSender::~NodeSender() = default;

bool NodeSender::isValid() const {
    return !nodeId.empty();
}

bool NodeSender::setNode(const std::string &id) {
    if (id.empty()) {
        return false;
    }
    nodeId = id;
    return true;
}

bool NodeSender::setNode(const DRNode &node) {
    return setNode(node.nodeId);
}

Response NodeSender::process(const Request &request) {
    const RequestScope scope;
    SetErr(ERR::kNone);
    Response response;
    if (!request.isValid()) {
        OVRA_ERR("Bad api [%s]", OvraDRCore::toLogString(request.toJson()).c_str());
        SetErr(ERR::kBadParameter);
        return response;
    }
    if (!nodeId.empty() && nodeId == DRNode::getLocalNodeId()) {
        return run(request);
    }
    const std::string remembered = getCachedCredId();
    if (processByCredId(remembered, request, response)) {
        return response;
    }
    const bool tried = GetErrCode() != ERR::kCredNotFound; // else its row could not be read
    OvraDRCore::ErrRecorder arrived;                       // of an attempt whose request may have
    const auto noteArrival = [this, &arrived] {
        if (mayHaveArrived(*this)) {
            arrived.SetErr(this);
        }
    };
    noteArrival();
    std::vector<DRNode> nodes;
    if (!DRNodeDB::ListCred(nodeId, nodes, kAllCreds)) {
        return {};
    }
    for (const DRNode &node : nodes) {
        if (tried && node.credId == remembered) {
            continue; // its error stays unless another attempt follows
        }
        SetErr(ERR::kNone);
        if (processByCred(node, request, response)) {
            break;
        }
        noteArrival();
    }
    if (GetErrCode() == ERR::kNotConnectable && arrived.GetErrCode() != ERR::kNone) {
        SetErr(&arrived); // "not connectable" would say that nothing was sent
    }
    return response;
}

bool NodeSender::process(const std::string &nodeId, const std::string &api,
                         const std::string &method, int version, const Json::Value &params,
                         Json::Value &out) {
    const Response response = NodeSender(nodeId).process(Request(api, version, method, params));
    out = response.getData();
    return response.isValid();
}

bool NodeSender::processByCredId(const std::string &credId, const Request &request,
                                 Response &response) {
    if (credId.empty() || !request.isValid()) {
        SetErr(ERR::kBadParameter);
        return false;
    }
    DRNode node;
    if (!DRNodeDB::GetCred(credId, node)) {
        SetErr(ERR::kCredNotFound);
        return false;
    }
    return processByCred(node, request, response);
}

bool NodeSender::processByCred(const DRNode &node, const Request &request, Response &response) {
    if (!node.isValid() || !request.isValid()) {
        SetErr(ERR::kBadParameter);
        return false;
    }
    CredNodeSender sender(node);
    const std::int64_t begun = OvraDRCore::Cache::Now();
    response = sender.process(request);
    const bool gotThrough = hasGotThrough(response);
    if (gotThrough) {
        NodeValidCredCache(node.nodeId).UpdateWithFinding(node.credId, begun);
    }
    if (gotThrough || isNoPermission(response)) {
        CredPermissionCache(node.credId).SetPrivilege(request, gotThrough, begun);
    }
    if (sender.GetErrCode() != ERR::kNone) {
        SetErr(&sender);
    }
    return gotThrough;
}

std::string NodeSender::getValidCredId() const {
    const RequestScope scope;
    std::vector<DRNode> nodes;
    if (nodeId.empty() || DRNode::isLocalNodeId(nodeId) ||
        !DRNodeDB::ListCred(nodeId, nodes, DRNodeDB::CRED_TYPE_NODE)) {
        return {};
    }
    for (const DRNode &node : nodes) {
        if (CredNodeSender(node).testPrivilege()) {
            return node.credId;
        }
    }
    return {};
}

std::string NodeSender::getCachedCredId() const {
    const Json::Value remembered = NodeValidCredCache(nodeId).Read();
    return remembered.isString() ? remembered.asString() : "";
}

bool NodeSender::isConnectable() const {
    const OvraDRCore::CacheWaitScope waits;
    const std::string id = getValidCredId();
    if (!id.empty()) {
        return BaseSender::IsConnectable(CredNodeSender(id).getNode().conn);
    }
    std::vector<DRNode> nodes;
    if (!DRNodeDB::ListCred(nodeId, nodes, DRNodeDB::CRED_TYPE_NODE)) {
        return false;
    }
    const RequestScope scope;
    for (const DRNode &node : nodes) {
        if (!RequestScope::isUnreachable(node.conn) && BaseSender::IsConnectable(node.conn)) {
            return true;
        }
    }
    return false;
}

CredNodeSender::CredNodeSender(const DRNode &node_) {
    (void)setCred(node_); // see isValid() and the error code
}

CredNodeSender::CredNodeSender(const std::string &credId) {
    (void)setCred(credId); // see isValid() and the error code
}

CredNodeSender::~CredNodeSender() = default;

bool CredNodeSender::isValid() const {
    return node.isValid();
}

bool CredNodeSender::setCred(const DRNode &value) {
    SetErr(ERR::kFailed);
    if (!value.isValid()) {
        SetErr(ERR::kCredInvalid);
        return false;
    }
    node = value;
    SetErr(ERR::kNone);
    return true;
}

bool CredNodeSender::setCred(const std::string &credId) {
    SetErr(ERR::kFailed);
    if (credId.empty()) {
        SetErr(ERR::kBadParameter);
        return false;
    }
    DRNode found;
    if (!DRNodeDB::GetCred(credId, found)) {
        SetErr(ERR::kCredInvalid);
        return false;
    }
    return setCred(found);
}

Response CredNodeSender::process(const Request &request) {
    SetErr(ERR::kNone);
    if (isLocal(node)) {
        return run(request);
    }
    if (!node.isValid()) {
        SetErr(ERR::kCredInvalid);
        return {};
    }
    if (isHeldUnreachable(node.conn)) {
        SetErr(ERR::kNotConnectable, node.conn.toJson());
        OVRA_NOTICE("Failed to send req [%s] since cache [%s] not connectable",
                    OvraDRCore::toLogString(request.toJson()).c_str(),
                    OvraDRCore::toString(node.conn.toJson()).c_str());
        return {};
    }
    SetErr(ERR::kFailed);
    const std::int64_t begun = OvraDRCore::Cache::Now();
    CredSessionSender sender(node.conn, node.session);
    if (!sender.getConn().isValid()) {
        RequestScope::noteUnreachable(node.conn); // the relay service does not say where it is
    }
    Response response = sender.process(request);
    if (!failedWith(sender, LibraryError::kOutOfMemory)) {
        CredPermissionCache(node.credId).SetPrivilege(request, hasGotThrough(response), begun);
    }
    if (sender.GetErrCode() != ERR::kNone) {
        SetErr(&sender);
    } else {
        SetErr(ERR::kNone);
    }
    return response;
}

bool CredNodeSender::testPrivilege() {
    const OvraDRCore::CacheWaitScope scope;
    SetErr(ERR::kFailed);
    if (!node.isValid()) {
        SetErr(ERR::kCredInvalid);
        return false;
    }
    if (isLocal(node)) {
        return true; // nothing was tested: the error code stays
    }
    if (!BaseSender::GetCachedConnectable(node.conn)) {
        SetErr(ERR::kNotConnectable);
        return false;
    }
    const bool has = CredPermissionCache(node.credId).HasPrivilege();
    SetErr(has ? ERR::kNone : ERR::kNoPrivilege);
    return has;
}

bool CredNodeSender::IsConnectable(const DRNode &node) {
    return isLocal(node) || BaseSender::IsConnectable(node.conn);
}

bool CredNodeSender::GetCachedConnectable(const DRNode &node) {
    return isLocal(node) || BaseSender::GetCachedConnectable(node.conn);
}

} // namespace OvraDRNode
