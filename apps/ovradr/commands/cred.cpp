// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "node_ref.h"
#include "output.h"
#include "provision/node_database.h"
#include "target.h"

#include <ovradrnode/node_db.h>

#include <memory>
#include <set>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

struct CredOptions {
    std::string node;
    bool temporary = false;
    std::string credId;
};

Outcome list(const CredOptions &options) {
    const Expected<std::string> nodeId =
        options.node.empty() ? Expected<std::string>("") : resolveNode(options.node);
    if (!nodeId) {
        return Refusal(nodeId.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    Report report;
    report.data["creds"] = Json::Value(Json::arrayValue);
    std::vector<FoundCred> creds;
    std::set<std::string> nodes;
    const auto read = [&](bool temporary) {
        const DRNodeDB::CredType table =
            temporary ? DRNodeDB::CRED_TYPE_TEMP : DRNodeDB::CRED_TYPE_NODE;
        std::vector<DRNode> records;
        nodeId->empty() ? DRNodeDB::List(records, table)
                        : DRNodeDB::ListCred(*nodeId, records, table);
        for (const DRNode &record : records) {
            creds.push_back({record, temporary});
            nodes.insert(record.nodeId);
        }
    };
    read(false);
    if (options.temporary) {
        read(true);
    }
    const OvraApps::NodeNames names(nodes);
    std::vector<std::vector<std::string>> rows;
    for (const auto &[record, temporary] : creds) {
        const std::string &name = names.of(record.nodeId).shown();
        Json::Value json = credJson(record, temporary);
        json["name"] = name;
        report.data["creds"].append(std::move(json));
        rows.push_back({name, shortId(record.credId), shortId(record.nodeId),
                        targetText(record.conn), temporary ? "temporary" : "lasting"});
    }
    const std::string none = nodeId->empty() ? "There are no credentials"
                             : options.temporary
                                 ? "There is no credential for the node " + *nodeId
                                 : "There is no lasting credential for the node " + *nodeId;
    report.text = rows.empty()
                      ? printable(none) + "; `ovradr cred create URL --account NAME` makes one.\n"
                      : table({"NAME", "CREDENTIAL", "NODE", "ENDPOINT", "KIND"}, rows);
    return report;
}

Report show(const FoundCred &cred) {
    Report report;
    report.data = credJson(cred.record, cred.temporary);
    report.text = credText(cred.record, cred.temporary);
    return report;
}

} // namespace

void addCredCommands(CLI::App &app, Command &chosen) {
    CLI::App *family =
        app.add_subcommand("cred", "The credentials with which this node reaches others.");
    family->require_subcommand(1);
    const auto options = std::make_shared<CredOptions>();
    addCredCreateCommand(*family, chosen);

    CLI::App *listCommand = family->add_subcommand("list", "List the credentials.");
    listCommand->add_option("--node", options->node, "Only those of this node");
    listCommand->add_flag("--temp", options->temporary, "The temporary ones as well");
    listCommand->footer("Example:\n  ovradr cred list --node 3f2a");
    listCommand->callback([&chosen, options] { chosen = [options] { return list(*options); }; });

    CLI::App *showCommand = family->add_subcommand("show", "Show a credential.");
    showCommand->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")
        ->required();
    showCommand->footer("Example:\n  ovradr cred show 81c0");
    showCommand->callback([&chosen, options] {
        chosen = [options] { return resolveCred(options->credId).map(show); };
    });

    addCredTestCommand(*family, chosen);
    addCredSetCommand(*family, chosen);
    addCredReverseCommand(*family, chosen);
    addCredDeleteCommand(*family, chosen);
}

} // namespace Ovradr
