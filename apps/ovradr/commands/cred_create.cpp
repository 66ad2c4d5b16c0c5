// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "node_ref.h"
#include "provision/node_database.h"
#include "remote_login.h"
#include "target.h"

#include <ovradrnode/node_create.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraApps::FlowState;
using OvraDRNode::Conn;
using OvraDRNode::CredCreate;
using OvraDRNode::DRNode;
namespace ERR = OvraDRCore::ERR;

constexpr const char *kStandardInput = "-";

struct CreateOptions {
    std::string url;
    RemoteLogin login;
    std::string fingerprint;
    std::string sessionFile;
    std::string credId;
    bool temporary = false;
    bool dryRun = false;
};

std::unique_ptr<CredCreate> newFlow(bool temporary) {
    if (temporary) {
        return std::make_unique<OvraDRNode::TempCredCreate>();
    }
    return std::make_unique<OvraDRNode::DRNodeCredCreate>();
}

Refusal flowFailure(const CredCreate &flow, const Conn &conn) {
    // The one code with which storing the row fails; no other step of a creation has it.
    if (flow.GetErrCode() == ERR::kCredNotFound) {
        return failure(ExitCode::kNotSetUp,
                       "The other appliance granted the credential, but it could not be stored.",
                       "The system log says why; correct that and make the credential again.");
    }
    return credFlowFailure(flow, flow.getSessionError(), conn);
}

Outcome checkOnly(const CredCreate &flow, const Conn &conn) {
    if (!flow.check()) {
        return flowFailure(flow, conn);
    }
    Report report;
    report.data["would_work"] = true;
    report.text = "It would work; nothing was made.\n";
    return report;
}

/// Carries out a flow that has proved itself.
Outcome runFlow(CredCreate &flow, const Conn &conn, const CreateOptions &options) {
    if (!flow.getRemoteNodeInfo()) {
        return flowFailure(flow, conn);
    }
    if (flow.isLocalNode()) {
        return failure(ExitCode::kUsage, targetText(conn) + " is this appliance itself.",
                       "Give the URL of another one.");
    }
    if (options.dryRun) {
        return checkOnly(flow, conn);
    }
    const FlowState state = OvraApps::createCredential(flow);
    if (state != FlowState::kDone) {
        return state == FlowState::kBusy ? busyFailure() : flowFailure(flow, conn);
    }
    const DRNode &record = flow.getNode();
    Report report;
    report.data = credJson(record, options.temporary);
    if (!options.login.account.empty()) {
        report.data["account"] = options.login.account;
    }
    report.text = credText(record, options.temporary, options.login.account);
    return report;
}

Outcome createByAccount(const CreateOptions &options, const Conn &conn) {
    const std::unique_ptr<CredCreate> flow = newFlow(options.temporary);
    bool proved = false;
    const auto attempt = [&](const std::string &password, const std::string &code) {
        proved = flow->setCred(conn, options.login.account, password, code);
        return proved ? 0 : flow->GetErrCode();
    };
    if (const auto tried = logIn(options.login, conn.addr, attempt); !tried) {
        return Refusal(tried.error());
    }
    return proved ? runFlow(*flow, conn, options) : flowFailure(*flow, conn);
}

Outcome createBySession(const CreateOptions &options, const Conn &conn) {
    PasswordSource source;
    source.fromStdin = options.sessionFile == kStandardInput;
    source.file = source.fromStdin ? "" : options.sessionFile;
    const Expected<Secret> session = obtainPassword(source, "Session", false);
    if (!session) {
        return Refusal(session.error());
    }
    const std::unique_ptr<CredCreate> flow = newFlow(options.temporary);
    return flow->setCred(conn, session->get()) ? runFlow(*flow, conn, options)
                                               : flowFailure(*flow, conn);
}

/// The other end is known and trusted already.
Outcome createByCred(const CreateOptions &options) {
    const Expected<FoundCred> cred = resolveCred(options.credId);
    if (!cred) {
        return Refusal(cred.error());
    }
    const std::unique_ptr<CredCreate> flow = newFlow(options.temporary);
    return flow->setCred(cred->record.credId) ? runFlow(*flow, cred->record.conn, options)
                                              : flowFailure(*flow, cred->record.conn);
}

Expected<void> checkProof(const CreateOptions &options) {
    const bool byCred = !options.credId.empty();
    const int proofs = (options.login.account.empty() ? 0 : 1) +
                       (options.sessionFile.empty() ? 0 : 1) + (byCred ? 1 : 0);
    if (proofs != 1) {
        return failure(ExitCode::kUsage, "One proof is needed, and only one.",
                       "Give --account, --from-session or --from-cred.");
    }
    if (byCred != options.url.empty()) {
        return failure(ExitCode::kUsage,
                       byCred ? "With --from-cred the endpoint is that of the credential."
                              : "The URL of the other appliance is missing.",
                       byCred
                           ? "Leave the URL out."
                           : "Write for example: ovradr cred create https://HOST --account NAME");
    }
    return {};
}

Outcome create(const CreateOptions &options) {
    if (const auto done = checkProof(options); !done) {
        return Refusal(done.error());
    }
    if (!options.credId.empty()) {
        return createByCred(options);
    }
    const Expected<Conn> conn = parseTarget(options.url);
    if (!conn) {
        return Refusal(conn.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    if (const auto trusted = trustedEndpoint(*conn, options.fingerprint); !trusted) {
        return Refusal(trusted.error());
    }
    return options.sessionFile.empty() ? createByAccount(options, *conn)
                                       : createBySession(options, *conn);
}

} // namespace

void addCredCreateCommand(CLI::App &family, Command &chosen) {
    CLI::App *command =
        family.add_subcommand("create", "Pair with another appliance: make a credential to it.");
    const auto options = std::make_shared<CreateOptions>();
    command->add_option("URL", options->url,
                        "https://HOST[:5001], http://HOST[:5000] or flk:ALIAS");
    addRemoteLoginOptions(*command, options->login);
    addFingerprintOption(*command, options->fingerprint);
    command->add_option("--from-session", options->sessionFile,
                        "Instead of an account: a file whose first line is a session that the "
                        "other appliance granted; \"-\" for standard input");
    command->add_option("--from-cred", options->credId,
                        "Instead of URL and account: a credential that this node holds");
    command->add_flag("--temp", options->temporary, "A temporary credential");
    command->add_flag("--dry-run", options->dryRun, "Only try whether it would work");
    command->footer(
        "The password is asked for, and so is the one-time code when the account needs one.\n"
        "Examples:\n"
        "  ovradr cred create https://nas2 --account repl\n"
        "  ovradr cred create https://192.0.2.20:5001 --account repl --otp 123456 \\\n"
        "      --password-file /root/nas2.password --fingerprint SHA256:...\n"
        "  ovradr cred create --from-cred 81c0 --temp");
    command->callback([&chosen, options] { chosen = [options] { return create(*options); }; });
}

} // namespace Ovradr
