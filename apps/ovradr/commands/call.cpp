// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "node_ref.h"
#include "output.h"
#include "renewal.h"
#include "usage.h"

#include <ovradrcore/json.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/sender.h>

#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <iostream>
#include <limits>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRCore::Request;
using OvraDRCore::Response;
namespace ERR = OvraDRCore::ERR;

constexpr long kMaxTimeout = 24L * 60 * 60;
constexpr std::size_t kMaxParams = std::size_t{8} * 1024 * 1024; // as large as a reply may be

struct CallOptions {
    std::string node;
    std::string api;
    std::string method;
    int version = 1;
    std::vector<std::string> params;
    std::string paramsFile;
    std::string credId;
    bool encrypt = false;
    long timeout = 0; ///< seconds; 0: the library's default
};

Refusal badParameter(const std::string &text, const std::string &why) {
    // Only the name: the value may be a secret.
    return failure(ExitCode::kUsage,
                   "The parameter \"" + text.substr(0, text.find('=')) + "\" " + why + ".",
                   "Write --param NAME=VALUE, or --param NAME:=JSON.");
}

/// Adds "name=value" (the value is taken as JSON if it is valid JSON, otherwise as text) or
/// "name:=json".
Expected<void> addParameter(Json::Value &params, const std::string &text) {
    const std::size_t equals = text.find('=');
    const bool forced = equals != std::string::npos && equals > 0 && text[equals - 1] == ':';
    const std::string name = text.substr(0, forced ? equals - 1 : equals);
    if (equals == std::string::npos || name.empty()) {
        return badParameter(text, "has no name or no value");
    }
    if (params.isMember(name)) {
        return badParameter(text, "is given twice");
    }
    Json::Value value;
    if (!OvraDRCore::fromString(value, text.substr(equals + 1))) {
        if (forced) {
            return badParameter(text, "is not JSON");
        }
        value = text.substr(equals + 1);
    }
    params[name] = value;
    return {};
}

/// The JSON object in a file, or in standard input for "-".
Expected<Json::Value> readParameters(const std::string &path) {
    std::ifstream file;
    if (path != "-") {
        file.open(path);
    }
    std::istream &input = path == "-" ? std::cin : file;
    std::string text(kMaxParams + 1, '\0');
    input.read(text.data(), static_cast<std::streamsize>(text.size()));
    text.resize(static_cast<std::size_t>(input.gcount()));
    Json::Value params;
    if (input.bad() || text.size() > kMaxParams || !OvraDRCore::fromString(params, text) ||
        !params.isObject()) {
        return failure(ExitCode::kUsage, path + " cannot be read, or holds no JSON object.",
                       "Give a file that holds one object with all parameters.");
    }
    return params;
}

Expected<Json::Value> collectParameters(const CallOptions &options) {
    Json::Value params(Json::objectValue);
    if (!options.paramsFile.empty()) {
        const Expected<Json::Value> read = readParameters(options.paramsFile);
        if (!read) {
            return Refusal(read.error());
        }
        params = *read;
    }
    for (const std::string &text : options.params) {
        if (const auto added = addParameter(params, text); !added) {
            return Refusal(added.error());
        }
    }
    return params;
}

struct Answer {
    Response response;
    OvraDRCore::ErrRecorder error; ///< why it is not a success
};

Answer sendOver(OvraDRNode::BaseSender &sender, const Request &request) {
    const Response response = sender.process(request);
    return {response, errorOf(sender, response)};
}

/// Sends over the named credential, or lets the library choose one.
Expected<Answer> send(const std::string &nodeId, const std::string &credId,
                      const Request &request) {
    if (credId.empty()) {
        OvraDRNode::NodeSender sender(nodeId);
        return sendOver(sender, request);
    }
    const Expected<FoundCred> cred = resolveCred(credId);
    if (!cred) {
        return Refusal(cred.error());
    }
    if (cred->record.nodeId != nodeId) {
        return failureOf(ERR::kOtherNode);
    }
    OvraDRNode::CredNodeSender sender(cred->record);
    return sendOver(sender, request);
}

Outcome report(const Answer &answer) {
    const Response &response = answer.response;
    if (!response.isSuccess()) {
        return failureOf(answer.error);
    }
    Report report;
    // A granted session is worth as much as a password.
    report.data = OvraDRCore::maskSecrets(response.getData());
    report.text = prettyJson(report.data);
    return report;
}

/// Whether a credential of the node goes through the relay service.
bool isRelayed(const std::string &nodeId) {
    std::vector<OvraDRNode::DRNode> creds;
    OvraDRNode::DRNodeDB::ListCred(
        nodeId, creds, OvraDRNode::DRNodeDB::CRED_TYPE_NODE | OvraDRNode::DRNodeDB::CRED_TYPE_TEMP);
    return std::any_of(creds.begin(), creds.end(),
                       [](const OvraDRNode::DRNode &cred) { return cred.conn.isFarlink(); });
}

Outcome call(const CallOptions &options) {
    const Expected<Json::Value> params = collectParameters(options);
    if (!params) {
        return Refusal(params.error());
    }
    Request request(options.api, options.version, options.method, *params);
    request.setEncryptRequired(options.encrypt);
    if (options.timeout > 0) {
        request.setResponseTimeout(options.timeout);
    }
    if (!request.isValid()) {
        return failure(ExitCode::kUsage, "A call needs an API and a method.",
                       "`ovradr call --help` shows an example.");
    }
    const Expected<std::string> nodeId = resolveNode(options.node);
    if (!nodeId) {
        return Refusal(nodeId.error());
    }
    const Expected<Answer> answer = send(*nodeId, options.credId, request);
    if (!answer) {
        return Refusal(answer.error());
    }
    if (!answer->response.isValid() && answer->error.GetErrCode() == ERR::kBadParameter &&
        isRelayed(*nodeId)) {
        return failure(ExitCode::kNotReachable,
                       "The relay service does not tell where the node is reached now.",
                       "`ovradr farlink status`, here and over there, says more.");
    }
    Outcome outcome = report(*answer);
    if (outcome) {
        return outcome;
    }
    const Refusal refused(outcome.error());
    return options.credId.empty() ? nodeFailure(refused, *nodeId)
                                  : credFailure(refused, options.credId);
}

} // namespace

void addCallCommand(CLI::App &app, Command &chosen) {
    CLI::App *command = app.add_subcommand("call", "Call a web API of a node.");
    const auto options = std::make_shared<CallOptions>();
    command->add_option("NODE", options->node, kNodeHelp)->required();
    command->add_option("API", options->api, "Name of the API")->required();
    command->add_option("METHOD", options->method, "Its method")->required();
    command->add_option("--version", options->version, "Version of the method (1)")
        ->check(wholeNumber(1, std::numeric_limits<int>::max()));
    command
        ->add_option("--param", options->params,
                     "NAME=VALUE, where VALUE is JSON or else text; NAME:=JSON")
        ->allow_extra_args(false);
    command->add_option("--params-file", options->paramsFile,
                        "A file with one JSON object of parameters; \"-\" for standard input");
    command->add_option("--cred", options->credId, "Over this credential and no other");
    command->add_flag("--encrypt", options->encrypt, "Seal the parameters to the receiver");
    command->add_option("--timeout", options->timeout, "Seconds to wait for the answer")
        ->check(wholeNumber(1, kMaxTimeout));
    command->footer("Secrets in the answer show as ***. A parameter that is a secret belongs into "
                    "--params-file.\n"
                    "Examples:\n"
                    "  ovradr call local OVRA.DR.Node info\n"
                    "  ovradr call 3f2a OVRA.DR.Node info --param 'additional=[\"timezone\"]'");
    command->callback([&chosen, options] { chosen = [options] { return call(*options); }; });
}

} // namespace Ovradr
