// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/request.h>

#include <json/value.h>

#include <string>

namespace OvraDRNode {

class BaseSender;

/// An operation that runs on the local node or, by a web-API request, on a remote one. A subclass
/// defines how to check the parameters, how to do the work locally, and which request does it
/// remotely; Run() decides where. An object serves one operation: construct, Run() once, read
/// GetErr() and GetResult(). examples/ has a complete one.
class OVRADRNODE_EXPORT NodeOperationDispatcher : public OvraDRCore::ErrRecorder {
public:
    ~NodeOperationDispatcher() override;
    /// Always true.
    virtual bool SetNodeId(const std::string &id);
    /// Does the work on the local node; Run() returns what this returns.
    [[nodiscard]] virtual bool RunLocal() = 0;
    /// The request that does the work on a remote node.
    virtual OvraDRCore::Request GetRequest() = 0;
    /// Called before anything else, wherever the operation is to run.
    [[nodiscard]] virtual bool IsValidParam() = 0;
    /// The credential for a remote run; "" lets the sender choose.
    virtual std::string GetCredId() const;

    NodeOperationDispatcher();
    explicit NodeOperationDispatcher(const std::string &nodeId);

    bool IsLocalNode() const;
    bool IsRemoteNode() const;
    /// The node is the local one, or known to the node database.
    [[nodiscard]] bool HasPrivilege() const;
    /// Checks, decides and runs. Codes: 401 bad parameters, 507 unknown node, 518 and 519 for the
    /// named credential, otherwise those of the sender or the remote.
    [[nodiscard]] bool Run();
    [[nodiscard]] bool RemoteRun();
    [[nodiscard]] bool RunNodeSender();
    [[nodiscard]] bool RunCredNodeSender(const std::string &credId);

    /// The remote's data after a successful remote run; null before.
    const Json::Value &GetResult() const { return result; }

protected:
    Json::Value result;
    std::string nodeId;

private:
    [[nodiscard]] bool runOver(BaseSender &sender);
};

} // namespace OvraDRNode
