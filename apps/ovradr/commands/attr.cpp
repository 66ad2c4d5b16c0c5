// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "node_ref.h"
#include "output.h"
#include "provision/node_database.h"

#include <ovrabase/encoding.h>
#include <ovrabase/utf8.h>
#include <ovradrnode/node_db.h>

#include <algorithm>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::DRNodeAttr;
using OvraDRNode::DRNodeDB;

constexpr std::size_t kMaxName = 255;
constexpr std::size_t kMaxValue = std::size_t{64} * 1024;

struct AttrOptions {
    std::string node;
    std::string app;
    std::string attr;
    std::string value;
    bool raw = false;
};

/// The attribute for scripts. JSON holds no bytes that are not UTF-8, so that the value stands
/// there in base64 (RFC 4648, section 4) as well.
Json::Value attrJson(const DRNodeAttr &attr) {
    Json::Value json = attr.toJson();
    json["value"] = OvraBase::isUtf8(attr.value) ? Json::Value(attr.value) : Json::Value();
    json["base64"] = OvraBase::toBase64(attr.value);
    return json;
}

std::string checkName(const std::string &name) {
    return name.empty() || name.size() > kMaxName ? "a name has 1 to 255 bytes" : "";
}

std::string checkValue(const std::string &value) {
    return value.size() > kMaxValue ? "a value has at most 64 KiB" : "";
}

/// All of the application's attributes of the node; `options.node` is a node id.
Expected<std::vector<DRNodeAttr>> read(const AttrOptions &options) {
    std::vector<DRNodeAttr> attrs;
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    if (!DRNodeDB::ListAttr(options.node, options.app, attrs)) {
        return failure(ExitCode::kNotSetUp, "The attributes cannot be read.",
                       "The system log says why.");
    }
    return attrs;
}

Outcome set(const AttrOptions &options) {
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    const DRNodeAttr attr(options.node, options.app, options.attr, options.value);
    if (!DRNodeDB::SetAttr(attr)) {
        return failure(ExitCode::kNotSetUp, "The attribute cannot be stored.",
                       "Check that the disk is neither full nor read-only; the system log says "
                       "more.");
    }
    Report report;
    report.data = attrJson(attr);
    return report;
}

Outcome get(const AttrOptions &options) {
    const Expected<std::vector<DRNodeAttr>> attrs = read(options);
    if (!attrs) {
        return Refusal(attrs.error());
    }
    const auto found =
        std::find_if(attrs->begin(), attrs->end(),
                     [&options](const DRNodeAttr &attr) { return attr.attr == options.attr; });
    if (found == attrs->end()) {
        return failure(ExitCode::kNotFound,
                       "The application \"" + options.app + "\" keeps no attribute \"" +
                           options.attr + "\" about this node.",
                       "`ovradr attr list NODE APP` shows those that there are.");
    }
    Report report;
    report.data = attrJson(*found);
    report.text = options.raw ? found->value : printable(found->value) + "\n";
    return report;
}

Outcome unset(const AttrOptions &options) {
    return get(options).and_then([&options](const Report &found) -> Outcome {
        if (!DRNodeDB::DeleteAttr(options.node, options.app, options.attr)) {
            return failure(ExitCode::kNotSetUp, "The attribute cannot be removed.",
                           "Check that the disk is neither full nor read-only; the system log says "
                           "more.");
        }
        Report report;
        report.data["removed"] = found.data;
        return report;
    });
}

Report reportOf(const std::vector<DRNodeAttr> &attrs) {
    Report report;
    report.data["attrs"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    for (const DRNodeAttr &attr : attrs) {
        report.data["attrs"].append(attrJson(attr));
        rows.push_back({attr.attr, attr.value});
    }
    report.text = rows.empty() ? "The application keeps no attributes about this node.\n"
                               : table({"ATTRIBUTE", "VALUE"}, rows);
    return report;
}

Outcome list(const AttrOptions &options) {
    return read(options).map(reportOf);
}

using Action = Outcome (*)(const AttrOptions &);

CLI::App *addAction(CLI::App &family, const char *name, const char *description,
                    const std::shared_ptr<AttrOptions> &options, Command &chosen, Action action) {
    CLI::App *command = family.add_subcommand(name, description);
    command->add_option("NODE", options->node, kNodeHelp)->required();
    command->add_option("APP", options->app, "Name of the application that keeps it")
        ->required()
        ->check(checkName);
    command->callback([&chosen, options, action] {
        chosen = [options, action] {
            return resolveNode(options->node).and_then([&](const std::string &nodeId) {
                options->node = nodeId;
                return action(*options);
            });
        };
    });
    return command;
}

} // namespace

void addAttrCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("attr", "Texts that applications keep about a node.");
    family->require_subcommand(1);
    const auto options = std::make_shared<AttrOptions>();
    CLI::App *setCommand =
        addAction(*family, "set", "Set an attribute, new or not.", options, chosen, set);
    CLI::App *getCommand =
        addAction(*family, "get", "Print the value of an attribute.", options, chosen, get);
    CLI::App *unsetCommand =
        addAction(*family, "unset", "Remove an attribute.", options, chosen, unset);
    for (CLI::App *command : {setCommand, getCommand, unsetCommand}) {
        command->add_option("ATTR", options->attr, "Name of the attribute")
            ->required()
            ->check(checkName);
    }
    setCommand->add_option("VALUE", options->value, "Its value, which may be empty; not a secret")
        ->required()
        ->check(checkValue);
    setCommand->footer("Example:\n  ovradr attr set 3f2a backup site 'Rack 7, Zürich'");
    unsetCommand->footer("Example:\n  ovradr attr unset 3f2a backup site");
    getCommand->add_flag("--raw", options->raw, "Its very bytes, and no line break behind them");
    getCommand->footer("Example:\n  ovradr attr get 3f2a backup site");
    addAction(*family, "list", "List the attributes of a node.", options, chosen, list)
        ->footer("Example:\n  ovradr attr list local backup");
}

} // namespace Ovradr
