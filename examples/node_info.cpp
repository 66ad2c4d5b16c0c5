// SPDX-License-Identifier: Apache-2.0

// Asks a node who it is: node_info NODE_ID, or node_info alone for this appliance.

#include <ovradrcore/json.h>
#include <ovradrnode/ovradrnode.h>

#include <iostream>

int main(int argc, char **argv) {
    const std::string nodeId = argc > 1 ? argv[1] : OvraDRNode::DRNode::getLocalNodeId();
    OvraDRNode::NodeSender sender(nodeId);
    const OvraDRCore::Response answer = sender.process(OvraDRNode::WebAPI::getDRNodeInfoAPI({}));
    if (!answer.isSuccess()) {
        // A refusal is in the answer; why there is no answer, in the sender.
        const OvraDRCore::ErrRecorder error = OvraDRNode::errorOf(sender, answer);
        std::cerr << (answer.isValid() ? "refused: " : "no answer: ")
                  << OvraDRCore::toString(error.GetErr()) << '\n';
        return 1;
    }
    std::cout << nodeId << " is " << answer.getDataFieldtoStr("hostname") << '\n';
}
