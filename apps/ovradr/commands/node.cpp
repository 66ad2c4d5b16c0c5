// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "output.h"

#include <ovradrnode/dr_node.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraDRNode::DRNode;

struct NodeIdOptions {
    bool reset = false;
    bool yes = false;
};

Trouble reset(bool yes) {
    if (!yes && !isInteractive()) {
        return failure(ExitCode::kUsage, "There is no terminal on which this could be confirmed.",
                       "Add --yes if you mean it.");
    }
    if (!yes && !confirm("Other appliances know this one by its node id and will have to pair with "
                         "it again. Make a new one?")) {
        return failure(ExitCode::kFailed, "The node id stays as it is.", "");
    }
    if (!DRNode::resetLocalNodeId()) {
        return failure(ExitCode::kNotSetUp, "The node id could not be reset.",
                       "Try again in a moment; the system log says more.");
    }
    return std::nullopt;
}

Outcome nodeId(const NodeIdOptions &options) {
    if (options.reset) {
        if (const Trouble trouble = reset(options.yes)) {
            return *trouble;
        }
    }
    const std::string id = DRNode::getLocalNodeId();
    if (id.empty()) {
        return failure(ExitCode::kNotSetUp, "This appliance has no node id, and none can be made.",
                       "Run `ovradr setup` as root.");
    }
    Report report;
    report.data["node_id"] = id;
    report.text = printable(id) + "\n";
    return report;
}

} // namespace

void addNodeCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("node", "This appliance as a node.");
    family->require_subcommand(1);
    CLI::App *id = family->add_subcommand("id", "Print the id of this node.");
    const auto options = std::make_shared<NodeIdOptions>();
    CLI::Option *resetFlag = id->add_flag("--reset", options->reset, "Make a new id first");
    id->add_flag("--yes", options->yes, "Do not ask")->needs(resetFlag);
    id->footer("Example:\n  ovradr node id");
    id->callback([&chosen, options] { chosen = [options] { return nodeId(*options); }; });
}

} // namespace Ovradr
