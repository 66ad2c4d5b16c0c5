// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "diagnosis.h"
#include "endpoint.h"
#include "node_ref.h"
#include "node_view.h"
#include "output.h"
#include "remote_login.h"
#include "target.h"
#include "trust.h"

#include <ovradrnode/node_db.h>

#include <algorithm>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

struct DoctorOptions {
    std::string subject = "local";
    std::string account;
    PasswordSource password;
    std::string oneTimeCode;
    std::string fingerprint;
};

/// The result of all diagnoses: the first failure, with everything that was found.
Outcome conclude(const std::vector<Diagnosis> &diagnoses) {
    Report report;
    report.data["examinations"] = Json::Value(Json::arrayValue);
    Expected<void> verdict;
    for (const Diagnosis &diagnosis : diagnoses) {
        report.data["examinations"].append(diagnosis.toJson());
        report.text += (report.text.empty() ? "" : "\n") + diagnosis.toText();
        verdict = verdict ? diagnosis.verdict() : verdict;
    }
    if (verdict) {
        report.text += "\nNothing is wrong.\n";
        return report;
    }
    verdict.error().data = report.data;
    verdict.error().text = report.text + "\n";
    return Refusal(verdict.error());
}

Outcome examineLocal() {
    std::vector<Diagnosis> diagnoses;
    diagnoses.emplace_back("This appliance");
    const bool daemonRuns = diagnoseAppliance(diagnoses.back());
    for (const Conn &conn : Conn::listLocal()) {
        diagnoses.emplace_back("Own endpoint " + targetText(conn));
        diagnoseEndpoint({conn, {}, {}, ownFingerprint(conn), true, daemonRuns}, diagnoses.back());
    }
    return conclude(diagnoses);
}

Outcome examineNode(const std::string &nodeId) {
    std::vector<Diagnosis> diagnoses;
    for (const auto &candidate : OvraDRNode::listNodeCandidates(nodeId)) {
        diagnoses.emplace_back("Credential " + shortId(candidate.node.credId) + ", " +
                               targetText(candidate.node.conn));
        diagnoseEndpoint({candidate.node.conn, candidate.node, {}, ""}, diagnoses.back());
    }
    return conclude(diagnoses);
}

/// A credential with this endpoint, the lasting ones first.
std::optional<DRNode> credentialAt(const Conn &conn) {
    std::vector<DRNode> records;
    DRNodeDB::List(records, DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP);
    const auto found = std::find_if(records.begin(), records.end(),
                                    [&conn](const DRNode &record) { return record.conn == conn; });
    return found == records.end() ? std::optional<DRNode>() : *found;
}

Outcome examineUrl(const DoctorOptions &options) {
    const Expected<Conn> conn = parseTarget(options.subject);
    if (!conn) {
        return Refusal(conn.error());
    }
    std::vector<Diagnosis> diagnoses;
    diagnoses.emplace_back("Endpoint " + targetText(*conn));
    if (options.account.empty()) {
        diagnoseEndpoint({*conn, credentialAt(*conn), {}, ""}, diagnoses.back());
        return conclude(diagnoses);
    }
    const Expected<Secret> password = obtainPassword(
        options.password, "Password of " + options.account + " on " + conn->addr, false);
    if (!password) {
        return Refusal(password.error());
    }
    const LoginTrial login{options.account, *password, options.oneTimeCode};
    diagnoseEndpoint({*conn, {}, login, options.fingerprint}, diagnoses.back());
    return conclude(diagnoses);
}

bool isUrl(const std::string &text) {
    return text.find("://") != std::string::npos || text.find("flk:") != std::string::npos;
}

Outcome doctor(const DoctorOptions &options) {
    if (isUrl(options.subject)) {
        return examineUrl(options);
    }
    if (!options.account.empty()) {
        return failure(ExitCode::kUsage, "An account belongs to one endpoint.",
                       "Give its URL instead of a node.");
    }
    if (options.subject == "local") {
        return examineLocal();
    }
    return resolveNode(options.subject).and_then([](const std::string &nodeId) {
        return DRNode::isLocalNodeId(nodeId) ? examineLocal() : examineNode(nodeId);
    });
}

} // namespace

void addDoctorCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("doctor", "Find out, step by step, what is in the way to a node.");
    const auto options = std::make_shared<DoctorOptions>();
    command->add_option(
        "SUBJECT", options->subject,
        "A node, by its name, its id or the beginning of it; a URL; or \"local\" (the default)");
    CLI::Option *account =
        command->add_option("--account", options->account, "Try a log-in with this account");
    addPasswordOptions(*command, options->password);
    addOneTimeCodeOption(*command, options->oneTimeCode)->needs(account);
    addFingerprintOption(*command, options->fingerprint)->needs(account);
    command->footer("Each step that can fail has an exit code of its own.\n"
                    "Examples:\n"
                    "  ovradr doctor\n"
                    "  ovradr doctor 3f2a\n"
                    "  ovradr doctor https://nas2 --account repl");
    command->callback(
        [&chosen, options] { chosen = forOwnUser([options] { return doctor(*options); }); });
}

} // namespace Ovradr
