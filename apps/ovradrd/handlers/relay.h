// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/request.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/operation_dispatcher.h>

#include <string>

namespace Ovradrd {

/// Relays a whole request of the caller to the node of a credential, over that credential.
class RelayOperation : public OvraDRNode::NodeOperationDispatcher {
public:
    /// \param via      the credential
    /// \param request  the relayed request; a relay is not relayed further
    RelayOperation(const OvraDRNode::DRNode &via, const OvraDRCore::Request &request);
    ~RelayOperation() override;

    bool RunLocal() override;
    OvraDRCore::Request GetRequest() override;
    bool IsValidParam() override;
    std::string GetCredId() const override;

private:
    std::string credId_;
    OvraDRCore::Request request_;
};

} // namespace Ovradrd
