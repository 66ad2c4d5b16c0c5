// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "node_ref.h"
#include "target.h"

#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraDRCore::Response;
using OvraDRNode::CredNodeSender;
using OvraDRNode::DRNode;
namespace WebAPI = OvraDRNode::WebAPI;

/// Why a request failed.
Refusal refusal(const CredNodeSender &sender, const Response &response) {
    Refusal found = failureOf(errorOf(sender, response));
    found.value().message.insert(0, targetText(sender.getNode().conn) + ": ");
    return found;
}

/// Whether the session is accepted, the node is the right one, and the right is there.
Outcome test(const FoundCred &cred) {
    const DRNode &record = cred.record;
    CredNodeSender sender(record);
    const Response info = sender.process(WebAPI::getDRNodeInfoAPI({}));
    if (!info.isSuccess()) {
        return refusal(sender, info);
    }
    if (info.getDataFieldtoStr("node_id") != record.nodeId) {
        return failure(ExitCode::kFailed,
                       targetText(record.conn) +
                           " is now another node than the one that the credential is for.",
                       "Delete the credential, and make a new one with `ovradr cred create`.");
    }
    const Response right = sender.process(WebAPI::getDRNodeTestPrivilegeAPI());
    if (!right.isSuccess()) {
        return refusal(sender, right);
    }
    const Response owner = sender.process(WebAPI::getDRNodeSessionGetAPI(record.session));
    const std::string account = owner.getDataFieldtoStr("account");
    Report report;
    report.data = credJson(record, cred.temporary);
    report.data["account"] = account;
    report.text = credText(record, cred.temporary, account) + "It works.\n";
    return report;
}

} // namespace

void addCredTestCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "test",
        "Try a credential: does its node answer, is it the right one, and the right there?");
    const auto credId = std::make_shared<std::string>();
    command->add_option("CRED_ID", *credId, "Its id, or the beginning of it")->required();
    command->footer("Nothing is changed.\nExample:\n  ovradr cred test 81c0");
    command->callback(
        [&chosen, credId] { chosen = [credId] { return resolveCred(*credId).and_then(test); }; });
}

} // namespace Ovradr
