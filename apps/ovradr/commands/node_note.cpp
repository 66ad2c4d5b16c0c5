// SPDX-License-Identifier: Apache-2.0
#include "commands/node_commands.h"
#include "node_ref.h"
#include "output.h"

#include <ovrabase/utf8.h>
#include <ovradrnode/node_db.h>

#include <algorithm>
#include <memory>

namespace Ovradr {

namespace {

using OvraApps::NodeNames;
using OvraDRNode::DRNodeDB;

struct NoteOptions {
    std::string node;
    std::string text;
};

std::string checkName(const std::string &name) {
    return name.empty() ? "" : OvraApps::nodeNameProblem(name);
}

std::string checkComment(const std::string &comment) {
    constexpr std::size_t kMaxComment = 255;
    return comment.size() > kMaxComment || !OvraBase::isUtf8(comment)
               ? "a comment has at most 255 bytes of UTF-8"
               : "";
}

/// Notes a text about the node, or removes the note if it is empty.
Outcome note(const std::string &nodeId, const char *attr, const std::string &text) {
    const bool noted = text.empty()
                           ? DRNodeDB::DeleteAttr(nodeId, OvraApps::kOwnApplication, attr)
                           : DRNodeDB::SetAttr(nodeId, OvraApps::kOwnApplication, attr, text);
    if (!noted) {
        return failure(ExitCode::kNotSetUp, "It cannot be noted in the node database.",
                       "Check that the disk is neither full nor read-only; the system log says "
                       "more.");
    }
    Report report;
    report.data = nodeJson(nodeId, NodeNames({nodeId}).of(nodeId));
    return report;
}

/// A name that a person gave belongs to one node; host names are as the nodes tell them.
Expected<void> checkFree(const std::string &nodeId, const std::string &name) {
    const NodeNames names({});
    const auto &others = names.named();
    const auto taken = std::find_if(others.begin(), others.end(), [&](const std::string &other) {
        return other != nodeId && OvraApps::NodeName{names.of(other).given, "", ""}.matches(name);
    });
    return taken == others.end()
               ? Expected<void>()
               : failure(ExitCode::kUsage,
                         "\"" + name + "\" is the name of the node " + *taken + " already.",
                         "Choose another one, or take it from that node with `ovradr node name " +
                             *taken + " \"\"`.");
}

Outcome giveName(const NoteOptions &options) {
    return resolveAnyNode(options.node).and_then([&options](const std::string &nodeId) -> Outcome {
        if (const auto isFree = checkFree(nodeId, options.text); !isFree) {
            return Refusal(isFree.error());
        }
        return note(nodeId, OvraApps::kNameAttr, options.text);
    });
}

Outcome comment(const NoteOptions &options) {
    return resolveAnyNode(options.node).and_then([&options](const std::string &nodeId) {
        return note(nodeId, OvraApps::kCommentAttr, options.text);
    });
}

} // namespace

void addNodeNoteCommands(CLI::App &family, Command &chosen) {
    const auto options = std::make_shared<NoteOptions>();
    CLI::App *name = family.add_subcommand("name", "Give a node a name, for this appliance alone.");
    name->add_option("NODE", options->node, kNodeHelp)->required();
    name->add_option("NAME", options->text, "Its name from now on; \"\" takes it away")
        ->required()
        ->check(checkName);
    name->footer("The name stands for the node wherever a NODE is taken, as its host name does.\n"
                 "Example:\n  ovradr node name 3f2a basement");
    name->callback([&chosen, options] { chosen = [options] { return giveName(*options); }; });

    CLI::App *comments = family.add_subcommand("comment", "Note something about a node.");
    comments->add_option("NODE", options->node, kNodeHelp)->required();
    comments->add_option("TEXT", options->text, "The comment, not a secret; \"\" removes it")
        ->required()
        ->check(checkComment);
    comments->footer("Example:\n  ovradr node comment 3f2a 'Rack 7, ask Ada before work on it'");
    comments->callback([&chosen, options] { chosen = [options] { return comment(*options); }; });
}

} // namespace Ovradr
