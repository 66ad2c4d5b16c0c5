// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "node_ref.h"
#include "node_view.h"
#include "output.h"
#include "target.h"

#include <memory>

namespace Ovradr {

namespace {

using OvraDRNode::NodeCandidate;

const char *outlookText(NodeCandidate::Outlook outlook) {
    switch (outlook) {
    case NodeCandidate::Outlook::kNext:
        return "next: ";
    case NodeCandidate::Outlook::kLater:
        return "later: ";
    default:
        return "passed over: ";
    }
}

std::string conclusion(const std::string &nodeId, const std::vector<NodeCandidate> &candidates) {
    const std::string doctor = "`ovradr doctor " + shortId(nodeId) +
                               "` tries each credential and says what is wrong with it.\n";
    const NodeCandidate *const next = winner(candidates);
    if (next == nullptr) {
        return "A request sent now fails at once: no credential is usable.\n" + doctor;
    }
    return printable("A request sent now goes over " + targetText(next->node.conn) +
                     ". What is marked \"was\" is asked again first.") +
           "\nWhat was answered is not kept: " + doctor;
}

Report why(const std::string &nodeId) {
    Report report;
    report.data["node_id"] = nodeId;
    report.data["local"] = OvraDRNode::DRNode::isLocalNodeId(nodeId);
    report.data["candidates"] = Json::Value(Json::arrayValue);
    if (report.data["local"].asBool()) {
        report.text = "This is the local node: requests to it need no credential.\n";
        return report;
    }
    const auto candidates = OvraDRNode::listNodeCandidates(nodeId);
    std::vector<std::vector<std::string>> rows;
    for (std::size_t i = 0; i < candidates.size(); ++i) {
        const NodeCandidate &candidate = candidates[i];
        const std::string reason = reasonText(candidates, i);
        Json::Value json = candidate.toJson();
        json["endpoint"] = targetText(candidate.node.conn);
        json["reason"] = reason;
        report.data["candidates"].append(json);
        rows.push_back({shortId(candidate.node.credId), targetText(candidate.node.conn),
                        candidate.temporary ? "temporary" : "lasting",
                        verdictText(candidate.reachable), verdictText(candidate.privilege),
                        outlookText(candidate.outlook) + reason});
    }
    report.text =
        table({"CREDENTIAL", "ENDPOINT", "KIND", "ANSWERS", "GOT THROUGH", "A REQUEST TRIES IT"},
              rows) +
        conclusion(nodeId, candidates);
    return report;
}

} // namespace

void addWhyCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("why", "Tell why requests to a node go the way that they go.");
    const auto node = std::make_shared<std::string>();
    command->add_option("NODE", *node, "A name, a node id, or the beginning of one")->required();
    command->footer("It reads what the processes of this appliance know and sends nothing.\n"
                    "Example:\n  ovradr why 3f2a");
    command->callback([&chosen, node] { chosen = [node] { return resolveNode(*node).map(why); }; });
}

} // namespace Ovradr
