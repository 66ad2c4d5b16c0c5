// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "commands/node_commands.h"
#include "node_ref.h"
#include "node_view.h"
#include "output.h"
#include "provision/node_database.h"
#include "renewal.h"
#include "target.h"

#include <ovradrcore/json.h>
#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/sender.h>

#include <memory>
#include <set>

namespace Ovradr {

namespace {

using OvraApps::NodeName;
using OvraDRNode::CachedVerdict;
using OvraDRNode::DRNode;
using OvraDRNode::NodeCache;
using OvraDRNode::NodeCandidate;

struct NodeIdOptions {
    bool reset = false;
    bool yes = false;
};

struct NodeInfoOptions {
    std::string node;
    bool refresh = false;
};

Json::Value toJson(const CachedVerdict &verdict) {
    return verdict.known ? Json::Value(verdict.value) : Json::Value();
}

Expected<void> reset(bool yes) {
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
    return {};
}

Outcome nodeId(const NodeIdOptions &options) {
    if (options.reset) {
        if (const auto done = reset(options.yes); !done) {
            return Refusal(done.error());
        }
    }
    return localNode().map([](const std::string &id) {
        Report report;
        report.data["node_id"] = id;
        report.text = printable(id) + "\n";
        return report;
    });
}

/// Has the node be asked whatever was found before: what stands against it is checked anew.
void dropVerdicts(const std::string &nodeId) {
    for (const NodeCandidate &candidate : OvraDRNode::listNodeCandidates(nodeId)) {
        const auto stands = [](const CachedVerdict &verdict) {
            return verdict.known && verdict.fresh && !verdict.value;
        };
        if (stands(candidate.reachable)) {
            (void)OvraDRNode::CredNodeSender::IsConnectable(candidate.node);
        }
        if (stands(candidate.privilege)) {
            (void)OvraDRNode::CredPermissionCache(candidate.node.credId).Update();
        }
    }
}

/// What a node says about itself, asked now.
Expected<Json::Value> askNode(const std::string &nodeId) {
    OvraDRNode::NodeSender sender(nodeId);
    const OvraDRCore::Response answer =
        sender.process(OvraDRNode::WebAPI::getDRNodeInfoAPI({"timezone"}));
    if (answer.isSuccess()) {
        return answer.getData();
    }
    return nodeFailure(failureOf(errorOf(sender, answer)), nodeId);
}

Outcome nodeInfo(const std::string &nodeId, bool refresh) {
    const NodeCache cache(nodeId, true);
    Json::Value info;
    if (!refresh) {
        info = cache.Read();
    }
    if (!info.isObject()) {
        dropVerdicts(nodeId);
        const Expected<Json::Value> asked = askNode(nodeId);
        if (!asked) {
            return Refusal(asked.error());
        }
        info = *asked;
        cache.Learn(info);
    }
    const bool local = DRNode::isLocalNodeId(nodeId);
    const CachedVerdict reachable = reachability(OvraDRNode::listNodeCandidates(nodeId));
    const double age = cache.GetLearntAge();
    const NodeName name = OvraApps::NodeNames({nodeId}).of(nodeId);
    Report report;
    report.data = nodeJson(nodeId, name);
    report.data["local"] = local;
    report.data["info"] = info;
    report.data["age"] = age < 0 ? Json::Value() : Json::Value(tenths(age));
    report.data["reachable"] = local ? Json::Value(true) : toJson(reachable);
    report.text =
        listing({{"name", name.given},
                 {"node", nodeId},
                 {"comment", name.comment},
                 {"host name", OvraDRCore::memberString(info, "hostname")},
                 {"serial number", OvraDRCore::memberString(info, "serial")},
                 {"time zone", OvraDRCore::memberString(info.get("additional", {}), "timezone")},
                 {"learnt", age < 0 ? "" : ageText(age) + " ago"},
                 {"answers", local ? "this node" : verdictText(reachable)}});
    return report;
}

/// \param candidates  none for this node
void addRow(const std::string &nodeId, const NodeName &name,
            const std::vector<NodeCandidate> &candidates, Report &report,
            std::vector<std::vector<std::string>> &rows) {
    const bool local = DRNode::isLocalNodeId(nodeId);
    const NodeCandidate *const next = winner(candidates);
    const CachedVerdict reachable = reachability(candidates);
    Json::Value json = nodeJson(nodeId, name);
    json["local"] = local;
    json["reachable"] = local ? Json::Value(true) : toJson(reachable);
    json["creds"] = Json::UInt64(candidates.size());
    json["cred_id"] = next == nullptr ? Json::Value() : Json::Value(next->node.credId);
    json["endpoint"] = next == nullptr ? Json::Value() : Json::Value(targetText(next->node.conn));
    report.data["nodes"].append(std::move(json));
    rows.push_back({name.shown(), shortId(nodeId), local ? "this node" : verdictText(reachable),
                    std::to_string(candidates.size()),
                    next == nullptr ? "" : shortId(next->node.credId),
                    next == nullptr ? "" : targetText(next->node.conn)});
}

/// From the caches alone; this node first.
Report nodeList(const std::string &local) {
    const OvraDRCore::CacheSnapshotScope snapshot;
    const auto nodes = OvraDRNode::listAllNodeCandidates();
    std::set<std::string> ids{local};
    for (const auto &[nodeId, candidates] : nodes) {
        ids.insert(nodeId);
    }
    const OvraApps::NodeNames names(ids);
    Report report;
    report.data["nodes"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    addRow(local, names.of(local), {}, report, rows);
    for (const auto &[nodeId, candidates] : nodes) {
        addRow(nodeId, names.of(nodeId), candidates, report, rows);
    }
    report.text = table({"NAME", "NODE", "ANSWERS", "CREDS", "NEXT", "OVER"}, rows);
    return report;
}

Outcome listAll() {
    const Expected<std::string> local = localNode();
    if (!local) {
        return Refusal(local.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    return nodeList(*local);
}

void addInfo(CLI::App &family, Command &chosen) {
    CLI::App *info = family.add_subcommand("info", "Show what a node says about itself.");
    const auto options = std::make_shared<NodeInfoOptions>();
    info->add_option("NODE", options->node, kNodeHelp)->required();
    info->add_flag("--refresh", options->refresh, "Ask it now, and fail when it does not answer");
    info->footer("Without --refresh a node is asked when its last answer is older than a minute, "
                 "and\nshown as it was when it does not answer.\n"
                 "Example:\n  ovradr node info 3f2a --refresh");
    info->callback([&chosen, options] {
        chosen = [options] {
            return resolveNode(options->node).and_then([&options](const std::string &nodeId) {
                return nodeInfo(nodeId, options->refresh);
            });
        };
    });
}

} // namespace

void addNodeCommands(CLI::App &app, Command &chosen) {
    CLI::App *family =
        app.add_subcommand("node", "The nodes: this appliance and those it reaches.");
    family->require_subcommand(1);
    CLI::App *id = family->add_subcommand("id", "Print the id of this node.");
    const auto options = std::make_shared<NodeIdOptions>();
    CLI::Option *resetFlag = id->add_flag("--reset", options->reset, "Make a new id first");
    id->add_flag("--yes", options->yes, "Do not ask")->needs(resetFlag);
    id->footer("Example:\n  ovradr node id");
    id->callback([&chosen, options] { chosen = [options] { return nodeId(*options); }; });

    addInfo(*family, chosen);
    addNodeNoteCommands(*family, chosen);
    CLI::App *list = family->add_subcommand("list", "List the nodes and how they are reached.");
    list->footer("It tells what the processes of this appliance know and sends nothing.\n"
                 "Example:\n  ovradr node list");
    list->callback([&chosen] { chosen = listAll; });
}

} // namespace Ovradr
