// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "output.h"
#include "progress.h"
#include "remote_login.h"
#include "target.h"
#include "trust.h"

#include <ovrabase/address.h>
#include <ovradrcore/json.h>
#include <ovradrcore/response.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/farlink.h>

#include <cctype>
#include <chrono>
#include <memory>
#include <thread>

namespace Ovradr {

namespace {

using OvraDRCore::Response;
using OvraDRNode::Conn;
using OvraPlatform::CredError;
using OvraPlatform::FarlinkClient;
using OvraPlatform::FarlinkFailure;
using OvraPlatform::FarlinkKey;
using OvraPlatform::FarlinkReply;
using OvraPlatform::FarlinkSettings;
namespace APIError = OvraPlatform::APIError;

struct FarlinkOptions {
    std::string server;
    std::string alias;
    std::string fingerprint;
    bool release = false;
};

std::string checkAlias(const std::string &text) {
    return OvraPlatform::isFarlinkAlias(text)
               ? ""
               : "an alias has 3 to 63 lower-case letters, digits and inner hyphens";
}

Conn serverOf(const FarlinkSettings &settings) {
    return Conn::https(settings.host, settings.port);
}

/// The service named by the user: https://HOST[:5443].
Expected<FarlinkSettings> parseServer(const std::string &given) {
    const std::string text = OvraBase::trimmed(given);
    const std::size_t host = text.find("://");
    const bool hasPort =
        host != std::string::npos &&
        text.find(':', text.find(']', host) != std::string::npos ? text.find(']', host)
                                                                 : host + 3) != std::string::npos;
    const Expected<Conn> conn =
        parseTarget(hasPort ? text
                            : (text.ends_with('/') ? text.substr(0, text.size() - 1) : text) + ":" +
                                  std::to_string(OvraPlatform::kFarlinkPort));
    if (!conn || conn->protocol != "https") {
        return failure(ExitCode::kUsage, "\"" + text + "\" is no relay service.",
                       "Write https://HOST or https://HOST:PORT.");
    }
    return FarlinkSettings{conn->addr, conn->port, ""};
}

Refusal serviceFailure(const FarlinkSettings &settings, const FarlinkFailure &why) {
    if (why.error != CredError::kNone) {
        return endpointFailure(serverOf(settings), why.error);
    }
    // The text after the last colon says what to do.
    const std::size_t colon = why.text.rfind(": ");
    Refusal refusal = failure(
        why.code == APIError::kNoPermission ? ExitCode::kNotPermitted : ExitCode::kFailed,
        "The relay service refuses: " + why.text.substr(0, colon) + ".",
        colon == std::string::npos ? "Its log says more." : why.text.substr(colon + 2) + ".");
    refusal.value().code = why.code;
    std::string &hint = refusal.value().hint;
    hint.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(hint.front())));
    return refusal;
}

Expected<FarlinkKey> ownKey() {
    const auto key = FarlinkKey::loadOrCreate();
    if (!key) {
        return failure(ExitCode::kNotSetUp, "No key for the relay service: " + key.error() + ".",
                       "Run `ovradr setup` as root first.");
    }
    return *key;
}

/// What the daemon says about the relay service; invalid if no daemon runs.
Response askDaemon() {
    return OvraDRNode::BaseSender::run(
        OvraDRCore::Request("OVRA.Core.Farlink", 1, "get", Json::Value(Json::objectValue)));
}

constexpr const char *kNoDaemon = "ovradrd does not run";

/// Waits until the daemon is connected under the alias at that port, which shows in its answers.
/// \return "", or why it is not connected in time
std::string waitForDaemon(int port) {
    // A daemon that had another alias notices the new one when its present call ends.
    constexpr std::chrono::seconds kLongest = OvraPlatform::kFarlinkHold + std::chrono::seconds(15);
    constexpr std::chrono::milliseconds kStep{200};
    Progress progress;
    progress.say("waiting for ovradrd to connect");
    const auto end = std::chrono::steady_clock::now() + kLongest;
    std::string problem = "it has not connected yet";
    while (std::chrono::steady_clock::now() < end) {
        const Response daemon = askDaemon();
        if (!daemon.isSuccess()) {
            return kNoDaemon;
        }
        if (daemon.getDataField("connected") == true && daemon.getDataField("port") == port) {
            return "";
        }
        const std::string told = OvraDRCore::memberString(daemon.getData(), "problem");
        problem = told.empty() ? problem : told;
        std::this_thread::sleep_for(kStep);
    }
    return problem;
}

Refusal notWritten() {
    return failure(ExitCode::kNotSetUp,
                   std::string(OvraPlatform::kFarlinkFile) + " cannot be written.",
                   "Run the command as root, on a disk that is not full.");
}

Outcome enable(const FarlinkOptions &options) {
    const Expected<FarlinkSettings> server = parseServer(options.server);
    if (!server) {
        return Refusal(server.error());
    }
    FarlinkSettings settings = *server;
    settings.alias = options.alias;
    if (const auto trusted = trustPeer(serverOf(settings), options.fingerprint, kShownByRelay);
        !trusted) {
        return Refusal(trusted.error());
    }
    Report report;
    report.data["server"] = targetText(serverOf(settings));
    if (!settings.alias.empty()) {
        // Reports now whether it is available, rather than in the daemon's log.
        const Expected<FarlinkKey> key = ownKey();
        if (!key) {
            return Refusal(key.error());
        }
        const FarlinkReply reply = FarlinkClient(settings).enrol(*key);
        if (!reply) {
            return serviceFailure(settings, reply.error());
        }
        report.data["alias"] = settings.alias;
        report.data["port"] = reply->getDataField("port");
    }
    if (!OvraPlatform::writeFarlinkSettings(settings)) {
        return notWritten();
    }
    std::string problem;
    if (!settings.alias.empty()) {
        problem = waitForDaemon(report.data["port"].asInt());
        report.data["connected"] = problem.empty();
        report.data["problem"] = problem;
    }
    report.text = listing(
        {{"server", report.data["server"].asString()},
         {"alias", settings.alias.empty() ? "none: only others are looked up" : settings.alias},
         {"callers at", settings.alias.empty() ? "" : "port " + report.data["port"].asString()},
         {"connected", settings.alias.empty() ? ""
                       : problem.empty()      ? "yes"
                                              : "no: " + problem}});
    if (problem.empty() || problem == kNoDaemon) {
        report.text += problem.empty() ? "" : "Nobody can call before ovradrd is started.\n";
        return report;
    }
    Refusal late =
        failure(ExitCode::kNotReachable,
                "The relay service is set up, but ovradrd is not connected to it: " + problem + ".",
                "It goes on trying; `ovradr farlink status` shows when it is.");
    late.value().data = report.data;
    return late;
}

Outcome disable(const FarlinkOptions &options) {
    const auto settings = OvraPlatform::readFarlinkSettings().value_or(FarlinkSettings());
    // First, so that the daemon does not come back.
    if (!OvraPlatform::writeFarlinkSettings({})) {
        return notWritten();
    }
    if (options.release && !settings.alias.empty()) {
        const Expected<FarlinkKey> key = ownKey();
        if (!key) {
            return Refusal(key.error());
        }
        const FarlinkClient client(settings);
        const FarlinkReply reply = client.enrol(*key).and_then([&client](const Response &answer) {
            return client.release(answer.getDataFieldtoStr("token"));
        });
        if (!reply) {
            Refusal refusal = serviceFailure(settings, reply.error());
            refusal.value().message.insert(
                0,
                "The relay service is off, but still keeps the alias \"" + settings.alias + "\": ");
            return refusal;
        }
    }
    Report report;
    report.data["alias"] = settings.alias;
    report.data["released"] = options.release && !settings.alias.empty();
    report.text = report.data["released"].asBool()
                      ? "The relay service is off, and the alias is free for others.\n"
                      : "The relay service is off. An alias stays reserved for this appliance "
                        "until it expires.\n";
    return report;
}

Outcome status() {
    const auto settings = OvraPlatform::readFarlinkSettings();
    if (!settings) {
        const std::string &why = settings.error();
        return failure(ExitCode::kNotSetUp, why.substr(0, why.rfind(": ")) + ".",
                       "Run `ovradr farlink enable` again.");
    }
    Report report;
    report.data["server"] = settings->host.empty() ? "" : targetText(serverOf(*settings));
    report.data["alias"] = settings->alias;
    if (settings->host.empty()) {
        report.text = "No relay service is used; `ovradr farlink enable` sets one up.\n";
        return report;
    }
    const Response daemon = askDaemon();
    const bool connected =
        OvraDRCore::memberString(daemon.getData(), "server_alias") == settings->alias &&
        daemon.getDataField("connected").isBool() && daemon.getDataField("connected").asBool();
    std::string state = "not needed: only others are looked up";
    if (!settings->alias.empty()) {
        report.data["connected"] = connected;
        const std::string problem = OvraDRCore::memberString(daemon.getData(), "problem");
        state = connected             ? "yes, callers at port " + daemon.getDataFieldtoStr("port")
                : !daemon.isSuccess() ? "no: ovradrd does not run"
                                      : "no: " + (problem.empty() ? "not yet" : problem);
        report.data["problem"] = connected ? "" : state.substr(4);
    }
    std::string expires;
    if (connected && daemon.getDataField("expires").isInt64()) {
        report.data["port"] = daemon.getDataField("port");
        report.data["expires"] = daemon.getDataField("expires");
        expires = timeText(daemon.getDataField("expires").asInt64()) + ", unless renewed";
    }
    report.text = listing({{"server", report.data["server"].asString()},
                           {"alias", settings->alias},
                           {"connected", state},
                           {"expires", expires}});
    return report;
}

} // namespace

void addFarlinkCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand(
        "farlink", "The relay service, through which appliances without a way in are reached.");
    family->require_subcommand(1);
    const auto options = std::make_shared<FarlinkOptions>();
    CLI::App *enableCommand =
        family->add_subcommand("enable", "Use a relay service, and be reached there.");
    enableCommand->add_option("--server", options->server, "https://HOST[:5443]")->required();
    enableCommand
        ->add_option("--alias", options->alias,
                     "Name of this appliance there; without one it only reaches others")
        ->check(checkAlias);
    addFingerprintOption(*enableCommand, options->fingerprint);
    enableCommand->footer("Example:\n"
                          "  ovradr farlink enable --server https://relay.example --alias nas1");
    enableCommand->callback(
        [&chosen, options] { chosen = forOwnUser([options] { return enable(*options); }); });
    CLI::App *disableCommand = family->add_subcommand("disable", "Use no relay service any more.");
    disableCommand->add_flag("--release", options->release, "Give the alias up, for anybody");
    disableCommand->footer("Example:\n  ovradr farlink disable");
    disableCommand->callback(
        [&chosen, options] { chosen = forOwnUser([options] { return disable(*options); }); });
    CLI::App *statusCommand = family->add_subcommand(
        "status", "Show which service is used, and whether this appliance is reached there.");
    statusCommand->footer("Example:\n  ovradr farlink status");
    statusCommand->callback([&chosen] { chosen = forOwnUser(status); });
}

} // namespace Ovradr
