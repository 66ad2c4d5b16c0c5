// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "endpoint.h"
#include "node_ref.h"
#include "output.h"
#include "provision/node_database.h"
#include "target.h"
#include "trust.h"

#include <ovradrnode/node_create.h>
#include <ovradrnode/node_db.h>

#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;
using OvraDRNode::CredCreate;
using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;
namespace ERR = OvraDRCore::ERR;

struct CredOptions {
    std::string url;
    std::string account;
    PasswordSource password;
    std::string oneTimeCode;
    bool askOneTimeCode = false;
    std::string fingerprint;
    bool temporary = false;
    std::string node;
    std::string credId;
};

Json::Value toJson(const DRNode &record, bool temporary) {
    Json::Value json = record.toJson();
    json["temporary"] = temporary;
    return json;
}

std::string toText(const DRNode &record, bool temporary, const std::string &account = "") {
    return listing({{"credential", record.credId},
                    {"node", record.nodeId},
                    {"endpoint", targetText(record.conn)},
                    {"account", account},
                    {"kind", temporary ? "temporary" : "lasting"}});
}

std::unique_ptr<CredCreate> newFlow(bool temporary) {
    if (temporary) {
        return std::make_unique<OvraDRNode::TempCredCreate>();
    }
    return std::make_unique<OvraDRNode::DRNodeCredCreate>();
}

Failure flowFailure(const CredCreate &flow, const Conn &conn) {
    // The one code with which storing the row fails; no other step of a creation has it.
    if (flow.GetErrCode() == ERR::kCredNotFound) {
        return failure(ExitCode::kNotSetUp,
                       "The other appliance granted the credential, but it could not be stored.",
                       "The system log says why; correct that and make the credential again.");
    }
    Failure found = failureOf(flow.GetErrCode(), flow.GetErrMsg());
    found.message = targetText(conn) + ": " + found.message;
    return found;
}

Outcome runFlow(CredCreate &flow, const Conn &conn, const CredOptions &options) {
    if (!flow.process()) {
        return flowFailure(flow, conn);
    }
    const DRNode &record = flow.getNode();
    Report report;
    report.data = toJson(record, options.temporary);
    report.data["account"] = options.account;
    report.text = toText(record, options.temporary, options.account);
    return report;
}

Expected<std::string> askOneTimeCode() {
    if (!isInteractive()) {
        return failure(ExitCode::kUsage,
                       "There is no terminal on which the one-time code could be asked for.",
                       "Give it with --otp.");
    }
    const Expected<Secret> code = askSecret("One-time code");
    return code ? Expected<std::string>(code->get()) : code.failure();
}

/// Logs in and makes the credential. A one-time code that the other end asks for is asked for here,
/// once, where there is somebody to ask.
Outcome createWith(const CredOptions &options, const Conn &conn, const Secret &password) {
    std::string oneTimeCode = options.oneTimeCode;
    bool mayAsk = oneTimeCode.empty() && isInteractive();
    if (options.askOneTimeCode) {
        const Expected<std::string> code = askOneTimeCode();
        if (!code) {
            return code.failure();
        }
        oneTimeCode = *code;
        mayAsk = false;
    }
    const std::unique_ptr<CredCreate> flow = newFlow(options.temporary);
    bool proved = flow->setCred(conn, options.account, password.get(), oneTimeCode);
    if (!proved && flow->GetErrCode() == ERR::kLoginOtpRequired && mayAsk) {
        const Expected<std::string> code = askOneTimeCode();
        if (!code) {
            return code.failure();
        }
        proved = flow->setCred(conn, options.account, password.get(), *code);
    }
    return proved ? runFlow(*flow, conn, options) : flowFailure(*flow, conn);
}

Outcome create(const CredOptions &options) {
    const Expected<Conn> conn = parseTarget(options.url);
    if (!conn) {
        return conn.failure();
    }
    if (const Trouble trouble = checkNodeDatabase()) {
        return *trouble;
    }
    const Expected<Conn> direct = directEndpoint(*conn);
    if (!direct) {
        return direct.failure();
    }
    if (const Trouble trouble = trustPeer(*direct, options.fingerprint)) {
        return *trouble;
    }
    const Expected<Secret> password = obtainPassword(
        options.password, "Password of " + options.account + " on " + direct->addr, false);
    return password ? createWith(options, *conn, *password) : password.failure();
}

Outcome list(const CredOptions &options) {
    std::string nodeId;
    if (!options.node.empty()) {
        const Expected<std::string> found = resolveNode(options.node);
        if (!found) {
            return found.failure();
        }
        nodeId = *found;
    }
    if (const Trouble trouble = checkNodeDatabase()) {
        return *trouble;
    }
    Report report;
    report.data["creds"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    const auto add = [&](bool temporary) {
        const DRNodeDB::CredType table =
            temporary ? DRNodeDB::CRED_TYPE_TEMP : DRNodeDB::CRED_TYPE_NODE;
        std::vector<DRNode> records;
        nodeId.empty() ? DRNodeDB::List(records, table)
                       : DRNodeDB::ListCred(nodeId, records, table);
        for (const DRNode &record : records) {
            report.data["creds"].append(toJson(record, temporary));
            rows.push_back({record.credId, record.nodeId, targetText(record.conn),
                            temporary ? "temporary" : "lasting"});
        }
    };
    add(false);
    if (options.temporary) {
        add(true);
    }
    report.text = rows.empty()
                      ? "There are no credentials; `ovradr cred create URL --account NAME` "
                        "makes one.\n"
                      : table({"CREDENTIAL", "NODE", "ENDPOINT", "KIND"}, rows);
    return report;
}

Outcome show(const CredOptions &options) {
    const Expected<FoundCred> cred = resolveCred(options.credId);
    if (!cred) {
        return cred.failure();
    }
    Report report;
    report.data = toJson(cred->record, cred->temporary);
    report.text = toText(cred->record, cred->temporary);
    return report;
}

void addCreate(CLI::App &family, const std::shared_ptr<CredOptions> &options, Command &chosen) {
    CLI::App *command =
        family.add_subcommand("create", "Pair with another appliance: make a credential to it.");
    command->add_option("URL", options->url, "https://HOST[:5001], http://HOST[:5000] or flk:ALIAS")
        ->required();
    command->add_option("--account", options->account, "Account on the other appliance")
        ->required();
    addPasswordOptions(*command, options->password);
    CLI::Option *code =
        command->add_option("--otp", options->oneTimeCode, "One-time code of the account");
    command->add_flag("--otp-prompt", options->askOneTimeCode, "Ask for the one-time code")
        ->excludes(code);
    command
        ->add_option("--fingerprint", options->fingerprint, "The key that the other end must have")
        ->check(checkFingerprint);
    command->add_flag("--temp", options->temporary, "A temporary credential");
    command->footer(
        "The password is asked for, and so is the one-time code when the account needs one.\n"
        "Examples:\n"
        "  ovradr cred create https://nas2 --account repl\n"
        "  ovradr cred create https://192.0.2.20:5001 --account repl --otp 123456 \\\n"
        "      --password-file /root/nas2.password --fingerprint SHA256:...");
    command->callback([&chosen, options] { chosen = [options] { return create(*options); }; });
}

} // namespace

void addCredCommands(CLI::App &app, Command &chosen) {
    CLI::App *family =
        app.add_subcommand("cred", "The credentials with which this node reaches others.");
    family->require_subcommand(1);
    const auto options = std::make_shared<CredOptions>();
    addCreate(*family, options, chosen);

    CLI::App *listCommand = family->add_subcommand("list", "List the credentials.");
    listCommand->add_option("--node", options->node, "Only those of this node");
    listCommand->add_flag("--temp", options->temporary, "The temporary ones as well");
    listCommand->footer("Example:\n  ovradr cred list --node 3f2a");
    listCommand->callback([&chosen, options] { chosen = [options] { return list(*options); }; });

    CLI::App *showCommand = family->add_subcommand("show", "Show a credential.");
    showCommand->add_option("CRED_ID", options->credId, "Its id, or the beginning of it")
        ->required();
    showCommand->footer("Example:\n  ovradr cred show 81c0");
    showCommand->callback([&chosen, options] { chosen = [options] { return show(*options); }; });
}

} // namespace Ovradr
