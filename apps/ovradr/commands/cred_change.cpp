// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "node_ref.h"
#include "output.h"
#include "remote_login.h"
#include "target.h"

#include <ovradrnode/node_set.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraApps::FlowResult;
using OvraApps::FlowState;
using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeCredSet;
namespace ERR = OvraDRCore::ERR;

struct SetOptions {
    std::string credId;
    std::string url;
    RemoteLogin login;
    std::string fingerprint;
    bool dryRun = false;
};

struct DeleteOptions {
    std::string credId;
    bool dryRun = false;
};

Refusal setFailure(const DRNodeCredSet &flow, const Conn &conn) {
    // The one code with which writing the row fails: the credential was found before.
    if (flow.GetErrCode() == ERR::kCredNotFound) {
        return failure(ExitCode::kNotSetUp,
                       "The other appliance granted a session, but it could not be stored.",
                       "The credential is as it was. The system log says why; correct that and "
                       "try again.");
    }
    Failure found = failureOf(flow).value();
    if (flow.GetErrCode() == ERR::kOtherNode) {
        found.message = "This is another node than the one that the credential is for.";
        found.hint = "Check the URL, or make a new credential with `ovradr cred create`.";
    }
    found.message.insert(0, targetText(conn) + ": ");
    return Refusal(found);
}

/// What an update did.
Report reportUpdate(const FlowResult &result, const std::string &account) {
    const DRNode &now = result.after;
    Report report;
    report.data = credJson(now, false);
    report.data["account"] = account;
    report.data["endpoint_changed"] = now.conn != result.before.conn;
    report.text = credText(now, false, account);
    if (now.session == result.before.session) {
        report.data["session"] = "unchanged";
        report.text += "The other appliance granted the same session as before.\n";
    } else {
        addRelease(report.data, result.release);
        report.text += "The previous session: " + printable(releaseText(result.release, false)) +
                       (result.release.state == OvraApps::Release::State::kLeft ? "\n" : ".\n");
    }
    return report;
}

Outcome runUpdate(DRNodeCredSet &flow, const DRNode &record, const Conn &conn,
                  const SetOptions &options) {
    if (!options.dryRun) {
        const FlowResult result = OvraApps::changeCredential(flow, record, conn);
        switch (result.state) {
        case FlowState::kDone:
            return reportUpdate(result, options.login.account);
        case FlowState::kGone:
            return failureOf(ERR::kCredNotFound);
        case FlowState::kBusy:
            return busyFailure();
        case FlowState::kFailed:
            break;
        }
        return setFailure(flow, conn);
    }
    if (!flow.check()) {
        return setFailure(flow, conn);
    }
    Report report;
    report.data["would_work"] = true;
    report.text = "It would work; nothing was changed.\n";
    return report;
}

Outcome set(const SetOptions &options) {
    const Expected<FoundCred> cred = resolveCred(options.credId);
    if (!cred) {
        return Refusal(cred.error());
    }
    const DRNode &record = cred->record;
    if (cred->temporary) {
        return failure(ExitCode::kUsage, "A temporary credential cannot be changed.",
                       "Delete it, and make a new one with `ovradr cred create --temp`.");
    }
    const Expected<Conn> conn =
        options.url.empty() ? Expected<Conn>(record.conn) : parseTarget(options.url);
    if (!conn) {
        return Refusal(conn.error());
    }
    const Expected<Conn> direct = trustedEndpoint(*conn, options.fingerprint);
    if (!direct) {
        return Refusal(direct.error());
    }
    DRNodeCredSet flow(record.credId);
    bool proved = false;
    const auto attempt = [&](const std::string &password, const std::string &code) {
        proved = flow.setCred(*conn, options.login.account, password, code);
        return proved ? 0 : flow.GetErrCode();
    };
    if (const auto tried = logIn(options.login, direct->addr, attempt); !tried) {
        return Refusal(tried.error());
    }
    return proved ? runUpdate(flow, record, *conn, options) : setFailure(flow, *conn);
}

/// What a deletion did, or would do, to the row and the session.
Report reportDeletion(const DRNode &record, const OvraApps::Release &release, bool foreseen) {
    Report report;
    report.data["cred_id"] = record.credId;
    report.data["node_id"] = record.nodeId;
    report.data["row"] = foreseen ? "present" : "removed";
    addRelease(report.data, release);
    report.text = listing({{"credential", record.credId},
                           {"node", record.nodeId},
                           {"row", foreseen ? "would be removed" : "removed"},
                           {"session", releaseText(release, foreseen)}});
    return report;
}

Outcome remove(const DeleteOptions &options) {
    const Expected<FoundCred> cred = resolveCred(options.credId);
    if (!cred) {
        return Refusal(cred.error());
    }
    if (options.dryRun) {
        return reportDeletion(cred->record, OvraApps::predictRelease(cred->record), true);
    }
    const FlowResult result = OvraApps::deleteCredential(cred->record, cred->temporary);
    if (result.state == FlowState::kBusy) {
        return busyFailure();
    }
    if (result.state != FlowState::kDone) {
        return failure(ExitCode::kNotSetUp,
                       "The credential could not be deleted from the node database.",
                       "It is as it was. The system log says why; look for a full or read-only "
                       "disk.");
    }
    return reportDeletion(cred->record, result.release, false);
}

} // namespace

void addCredSetCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "set", "Log in anew for a credential, perhaps at another endpoint of the same node.");
    const auto options = std::make_shared<SetOptions>();
    command->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")->required();
    command->add_option("--url", options->url, "The new endpoint; without it the present one");
    addRemoteLoginOptions(*command, options->login)->required();
    addFingerprintOption(*command, options->fingerprint);
    command->add_flag("--dry-run", options->dryRun, "Only try whether it would work");
    command->footer("Examples:\n"
                    "  ovradr cred set 81c0 --account repl\n"
                    "  ovradr cred set 81c0 --url https://192.0.2.21 --account repl --dry-run");
    command->callback([&chosen, options] { chosen = [options] { return set(*options); }; });
}

void addCredDeleteCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "delete", "Delete a credential, and release its session when nothing else uses it.");
    const auto options = std::make_shared<DeleteOptions>();
    command->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")->required();
    command->add_flag("--dry-run", options->dryRun, "Only tell what would become of the session");
    command->footer("The other appliance need not answer.\nExample:\n  ovradr cred delete 81c0");
    command->callback([&chosen, options] { chosen = [options] { return remove(*options); }; });
}

} // namespace Ovradr
