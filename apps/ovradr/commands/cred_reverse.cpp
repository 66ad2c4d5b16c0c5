// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "node_ref.h"
#include "output.h"
#include "pairing.h"
#include "target.h"

#include <ovradrcore/json.h>
#include <ovradrnode/cred_reverse_create.h>

#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRCore::memberString;
using OvraDRNode::Conn;
using OvraDRNode::CredReverseCreate;
using OvraDRNode::DRNode;
namespace ERR = OvraDRCore::ERR;

struct ReverseOptions {
    std::string credId;
    std::string account;
    std::vector<std::string> endpoints;
    bool temporary = false;
    bool dryRun = false;
};

Outcome report(const ReverseOptions &options, const DRNode &via, const CredReverseCreate &flow) {
    Report report;
    if (options.dryRun) {
        report.data["would_work"] = true;
        report.text = "It would work; nothing was made.\n";
        return report;
    }
    const Json::Value &made = flow.getCredInfo();
    if (!made.isObject()) {
        return reverseFailure(flow);
    }
    const Conn conn = Conn::fromJson(made);
    report.data["cred_id"] = memberString(made, "cred_id");
    report.data["node_id"] = via.nodeId;
    report.data["endpoint"] = conn.isValid() ? Json::Value(targetText(conn)) : Json::Value();
    report.data["temporary"] = options.temporary;
    report.text = listing({{"credential", memberString(made, "cred_id")},
                           {"held by", via.nodeId},
                           {"endpoint", conn.isValid() ? targetText(conn) : ""},
                           {"account", options.account},
                           {"kind", options.temporary ? "temporary" : "lasting"}});
    return report;
}

Outcome reverse(const ReverseOptions &options) {
    const Expected<FoundCred> cred = resolveCred(options.credId);
    if (!cred) {
        return Refusal(cred.error());
    }
    const Expected<std::vector<Conn>> conns = offeredConns(options.endpoints);
    if (!conns) {
        return Refusal(conns.error());
    }
    if (const auto permitted = localAccount(options.account); !permitted) {
        return Refusal(permitted.error());
    }
    const std::unique_ptr<CredReverseCreate> flow =
        options.temporary ? std::make_unique<OvraDRNode::TempCredReverseCreate>()
                          : std::make_unique<CredReverseCreate>();
    if (!flow->setCredId(cred->record.credId)) {
        return failureOf(ERR::kCredInvalid);
    }
    const bool armed = flow->setLocalAccount(options.account) && flow->addLocalConns(*conns);
    const bool done = armed && (options.dryRun ? flow->check() : flow->process());
    return done ? report(options, cred->record, *flow) : reverseFailure(*flow);
}

} // namespace

void addCredReverseCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "reverse", "Have the node of a credential make a credential back to this appliance.");
    const auto options = std::make_shared<ReverseOptions>();
    command->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")->required();
    command
        ->add_option("--account", options->account,
                     "Account of this appliance that may pair, with whose rights the other one "
                     "comes")
        ->required();
    command
        ->add_option("--endpoint", options->endpoints,
                     "Offer this endpoint; may be repeated; without it all of this appliance")
        ->allow_extra_args(false);
    command->add_flag("--temp", options->temporary, "A temporary credential");
    command->add_flag("--dry-run", options->dryRun, "Only try whether it would work");
    command->footer("Examples:\n"
                    "  ovradr cred reverse 81c0 --account repl\n"
                    "  ovradr cred reverse 81c0 --account repl --endpoint https://192.0.2.10");
    command->callback([&chosen, options] { chosen = [options] { return reverse(*options); }; });
}

} // namespace Ovradr
