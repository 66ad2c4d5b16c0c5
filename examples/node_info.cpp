// SPDX-License-Identifier: Apache-2.0

// Asks a node for its identity: node_info NODE_ID, or node_info alone for this appliance.

#include <ovradrcore/json.h>
#include <ovradrnode/ovradrnode.h>

#include <iostream>

int main(int argc, char **argv) {
    const std::string nodeId = argc > 1 ? argv[1] : OvraDRNode::DRNode::getLocalNodeId();
    OvraDRNode::NodeSender sender(nodeId);
    const OvraDRCore::Response answer = sender.process(OvraDRNode::WebAPI::getDRNodeInfoAPI({}));
    if (!answer.isSuccess()) {
        // A refusal is in the answer; the reason for a missing answer is in the sender.
        const OvraDRCore::ErrRecorder error = OvraDRNode::errorOf(sender, answer);
        std::cerr << (answer.isValid() ? "refused: " : "no answer: ")
                  << OvraDRCore::toString(error.GetErr()) << '\n';
        return 1;
    }
    std::cout << nodeId << " is " << answer.getDataFieldtoStr("hostname") << '\n';
}
