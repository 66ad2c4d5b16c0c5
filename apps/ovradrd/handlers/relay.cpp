// SPDX-License-Identifier: Apache-2.0
#include "handlers/relay.h"

#include "handlers/words.h"

#include <ovradrcore/response.h>
#include <ovradrnode/sender.h>

namespace Ovradrd {

RelayOperation::RelayOperation(const OvraDRNode::DRNode &via, const OvraDRCore::Request &request)
    : NodeOperationDispatcher(via.nodeId)
    , credId_(via.credId)
    , request_(request) {}

RelayOperation::~RelayOperation() = default;

/// A credential that reaches this very node.
bool RelayOperation::RunLocal() {
    const OvraDRCore::Response response = OvraDRNode::BaseSender::run(request_);
    if (!response.isSuccess()) {
        SetErr(response.getErrCode(), response.getErrMsg());
        return false;
    }
    result = response.getData();
    return true;
}

OvraDRCore::Request RelayOperation::GetRequest() {
    return request_;
}

bool RelayOperation::IsValidParam() {
    const bool isRelay = request_.getAPI() == kCredentialApi && request_.getMethod() == kRelay;
    return request_.isValid() && !isRelay;
}

std::string RelayOperation::GetCredId() const {
    return credId_;
}

} // namespace Ovradrd
