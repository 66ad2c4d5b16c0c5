// SPDX-License-Identifier: Apache-2.0

// Finds which of several endpoints a node can reach. A complete operation that runs locally or
//   remotely: reachable_from NODE_ID PROTOCOL:ADDRESS:PORT...
// NODE_ID "local" is this appliance. For another node, OVRADR_CRED=CRED_ID selects the credential;
// without it the library uses one that works.

#include <ovradrcore/json.h>
#include <ovradrnode/ovradrnode.h>

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <string>
#include <vector>

using OvraDRNode::Conn;
using OvraDRNode::DRNode;

/// Defines the operation; Run() of the base class does the rest.
class FindReachable : public OvraDRNode::NodeOperationDispatcher {
public:
    FindReachable(const std::string &nodeId, const std::vector<Conn> &conns,
                  const std::string &credId)
        : NodeOperationDispatcher(nodeId)
        , conns_(conns)
        , credId_(credId) {}

    /// Called first, also for a remote node: nothing is sent that it would refuse.
    bool IsValidParam() override {
        constexpr std::size_t kMaxConns = 32;
        return !conns_.empty() && conns_.size() <= kMaxConns &&
               std::all_of(conns_.begin(), conns_.end(),
                           [](const Conn &conn) { return conn.isValid(); });
    }

    /// The work on the local node.
    bool RunLocal() override {
        for (const Conn &conn : conns_) {
            if (OvraDRNode::BaseSender::IsConnectable(conn)) {
                result = conn.toJson();
                return true;
            }
        }
        SetErr(OvraDRCore::ERR::kNotConnectable, "this node reaches none of the endpoints");
        return false;
    }

    /// The request that makes another node do the same.
    OvraDRCore::Request GetRequest() override {
        return OvraDRNode::WebAPI::getDRNodeTestConnectionAPI(conns_);
    }

    std::string GetCredId() const override { return credId_; }

private:
    std::vector<Conn> conns_;
    std::string credId_;
};

/// "https:192.0.2.7:5001"; malformed text gives an invalid endpoint.
static Conn parseConn(const std::string &text) {
    const std::size_t first = text.find(':');
    const std::size_t last = text.rfind(':');
    if (first == std::string::npos || first == last) {
        return {};
    }
    return Conn(text.substr(first + 1, last - first - 1), text.substr(0, first),
                std::atoi(text.c_str() + last + 1));
}

int main(int argc, char **argv) {
    if (argc < 2) {
        std::cerr << "usage: reachable_from NODE_ID PROTOCOL:ADDRESS:PORT...\n";
        return 2;
    }
    const std::string node = argv[1];
    std::vector<Conn> conns;
    std::transform(argv + 2, argv + argc, std::back_inserter(conns), parseConn);
    const char *const credId = std::getenv("OVRADR_CRED");

    FindReachable operation(node == "local" ? DRNode::getLocalNodeId() : node, conns,
                            credId != nullptr ? credId : "");
    if (!operation.Run()) {
        std::cerr << "failed: " << OvraDRCore::toString(operation.GetErr()) << '\n';
        return 1;
    }
    std::cout << OvraDRCore::toString(operation.GetResult()) << '\n';
}
