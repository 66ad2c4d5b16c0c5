// SPDX-License-Identifier: Apache-2.0
#include "commands/cred_commands.h"
#include "cred_report.h"
#include "endpoint.h"
#include "node_ref.h"
#include "open_call.h"
#include "output.h"
#include "remote_login.h"
#include "shared/session_lock.h"
#include "target.h"
#include "trust.h"

#include <ovradrnode/cred_permission_cache.h>
#include <ovradrnode/node_cache.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_set.h>
#include <ovradrnode/sender.h>

#include <memory>

namespace Ovradr {

namespace {

using OvraApps::FlowResult;
using OvraApps::FlowState;
using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeCredSet;
using OvraDRNode::DRNodeDB;
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
    Refusal found = withClock(credFlowFailure(flow, flow.getSessionError(), conn), conn);
    if (flow.GetErrCode() == ERR::kOtherNode) {
        found.value().message =
            targetText(conn) + ": This is another node than the one that the credential is for.";
        found.value().hint = "Check the URL, or make a new credential with `ovradr cred create`.";
    }
    return found;
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

Report wouldWork() {
    Report report;
    report.data["would_work"] = true;
    report.text = "It would work; nothing was changed.\n";
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
    return wouldWork();
}

/// The fingerprint that the new endpoint must have: the required one, or that of the key by which
/// the credential's present endpoint is known, if the new one shows the same; else "".
Expected<std::string> expectedKey(const SetOptions &options, const Conn &present,
                                  const Conn &direct) {
    if (!options.fingerprint.empty()) {
        return options.fingerprint;
    }
    const auto met =
        OvraPlatform::peerFingerprint(direct.protocol, direct.addr, direct.port, kKeySeconds);
    if (!met) {
        return endpointFailure(direct, met.error());
    }
    const std::string known = OvraPlatform::trustKey(present.protocol, present.addr, present.port);
    const bool same = OvraPlatform::TrustStore().lookup(known, met->fingerprint) ==
                      OvraPlatform::TrustVerdict::kTrusted;
    return same ? met->fingerprint : "";
}

/// Takes a credential with its session to another endpoint of its node.
Outcome move(const SetOptions &options, const DRNode &known, const Conn &conn) {
    const Expected<void> trusted = directEndpoint(conn).and_then([&](const Conn &direct) {
        return expectedKey(options, known.conn, direct).and_then([&](const std::string &key) {
            return trustPeer(direct, key).and_then([&] { return probeEndpoint(direct); });
        });
    });
    if (!trusted) {
        return Refusal(trusted.error());
    }
    const OvraApps::SessionLock lock(known.nodeId, OvraApps::SessionLock::Purpose::kRelease);
    if (lock.isBusy()) {
        return busyFailure();
    }
    FoundCred cred;
    if (!DRNodeDB::GetCred(known.credId, cred.record)) {
        return failureOf(ERR::kCredNotFound);
    }
    const bool changed = cred.record.conn != conn;
    cred.record.conn = conn;
    OvraDRNode::CredSessionSender sender(conn, cred.record.session);
    Outcome tested = testCred(sender, cred);
    if (!tested || options.dryRun) {
        return tested ? wouldWork() : tested;
    }
    if (!DRNodeDB::SetConn(known.credId, conn)) {
        return failure(ExitCode::kNotSetUp, "The new endpoint could not be stored.",
                       "The credential is as it was. The system log says why; correct that and "
                       "try again.");
    }
    OvraDRNode::CredPermissionCache(known.credId).Update();
    OvraDRNode::NodeCache(known.nodeId, true).Update();
    tested->data["endpoint_changed"] = changed;
    tested->data["session"] = "unchanged";
    return tested;
}

Outcome set(const SetOptions &options) {
    const RemoteLogin &login = options.login;
    const bool moves = login.account.empty();
    const bool proof = login.password.fromStdin || !login.password.file.empty() ||
                       !login.oneTimeCode.empty() || login.askOneTimeCode;
    if (moves && (proof || options.url.empty())) {
        return failure(
            ExitCode::kUsage, "The account for the new log-in is missing.",
            "Give --account, or --url alone to move the credential to another endpoint.");
    }
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
    if (moves) {
        return move(options, record, *conn);
    }
    if (const auto trusted = trustedEndpoint(*conn, options.fingerprint); !trusted) {
        return Refusal(trusted.error());
    }
    DRNodeCredSet flow(record.credId);
    bool proved = false;
    const auto attempt = [&](const std::string &password, const std::string &code) {
        proved = flow.setCred(*conn, options.login.account, password, code);
        return proved ? 0 : flow.GetErrCode();
    };
    if (const auto tried = logIn(options.login, conn->addr, attempt); !tried) {
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
        "set", "Log in anew for a credential, or move it to another endpoint of the same node.");
    const auto options = std::make_shared<SetOptions>();
    command->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")->required();
    command->add_option("--url", options->url, "The new endpoint; without it the present one");
    addRemoteLoginOptions(*command, options->login);
    addFingerprintOption(*command, options->fingerprint);
    command->add_flag("--dry-run", options->dryRun, "Only try whether it would work");
    command->footer(
        "Without --account the session stays. Nobody is asked for anything then if the new\n"
        "endpoint shows the key of the present one.\n"
        "Examples:\n"
        "  ovradr cred set 81c0 --url https://192.0.2.21\n"
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
