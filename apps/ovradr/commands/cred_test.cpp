// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "endpoint.h"
#include "node_ref.h"
#include "renewal.h"
#include "target.h"

#include <ovradrnode/node_api.h>
#include <ovradrnode/sender.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraDRCore::Response;
using OvraDRNode::DRNode;
namespace WebAPI = OvraDRNode::WebAPI;

Outcome test(const FoundCred &cred) {
    // Now, whatever others found before.
    const auto answers = directEndpoint(cred.record.conn).and_then(probeEndpoint);
    if (!answers) {
        return Refusal(answers.error());
    }
    OvraDRNode::CredNodeSender sender(cred.record);
    return testCred(sender, cred).map([](Report report) {
        report.text += "It works.\n";
        return report;
    });
}

} // namespace

Outcome testCred(OvraDRNode::BaseSender &sender, const FoundCred &cred) {
    const DRNode &record = cred.record;
    const auto refusal = [&](const Response &response) {
        Refusal found = credFailure(failureOf(errorOf(sender, response)), record.credId);
        nameEndpoint(found.value(), record.conn);
        return found;
    };
    const Response info = sender.process(WebAPI::getDRNodeInfoAPI({}));
    if (!info.isSuccess()) {
        return refusal(info);
    }
    if (info.getDataFieldtoStr("node_id") != record.nodeId) {
        return failure(ExitCode::kFailed,
                       targetText(record.conn) +
                           " is now another node than the one that the credential is for.",
                       "Check the endpoint, or make a new credential with `ovradr cred create`.");
    }
    const Response right = sender.process(WebAPI::getDRNodeTestPrivilegeAPI());
    if (!right.isSuccess()) {
        return refusal(right);
    }
    const Response owner = sender.process(WebAPI::getDRNodeSessionGetAPI(record.session));
    const std::string account = owner.getDataFieldtoStr("account");
    Report report;
    report.data = credJson(record, cred.temporary);
    report.data["account"] = account;
    report.text = credText(record, cred.temporary, account);
    return report;
}

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
