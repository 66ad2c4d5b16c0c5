// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "node_ref.h"
#include "output.h"
#include "progress.h"
#include "provision/node_database.h"
#include "rate.h"
#include "target.h"
#include "usage.h"

#include <ovradrnode/node.h>
#include <ovradrnode/sender.h>

#include <memory>
#include <vector>

namespace Ovradr {

namespace {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::ErrRecorder;
using OvraDRCore::Response;
using OvraDRNode::Conn;

constexpr int kMaxRetries = 10;
constexpr int kMaxSeconds = 45; // the other appliance has a minute for its answer
constexpr int kMaxUrlSeconds = 600;

struct SpeedOptions {
    std::string node;
    std::string url;
    int retries = 1;
    int seconds = 15;
};

/// The result for one endpoint of this appliance.
struct Tried {
    std::string endpoint;
    Expected<std::string> speed;
};

/// A script's last message before it failed, without its own name; `fallback` if there are none.
std::string reasonOf(const std::string &said, const std::string &fallback) {
    const std::size_t colon = said.find(".sh: ");
    const std::string reason = colon == std::string::npos ? said : said.substr(colon + 5);
    return reason.empty() ? fallback : reason;
}

void addSpeed(Report &report, const std::string &speed) {
    report.data["speed"] = speed;
    if (const auto bits = bitsPerSecond(speed)) {
        report.data["bits_per_second"] = *bits;
    }
}

Outcome measureUrl(const SpeedOptions &options) {
    OvraDRNode::Node test;
    std::string speed;
    std::string said;
    {
        Progress progress;
        progress.say(options.url + ": measuring");
        speed = test.TestDownloadSpeed(options.url, options.retries, options.seconds);
        said = progress.caught();
    }
    if (speed.empty() && test.GetErrCode() == ERR::kBadParameter) {
        return failure(ExitCode::kNotSetUp, "The script that measures cannot be run.",
                       "Run `ovradr setup`; the system log says more.");
    }
    if (speed.empty()) {
        return failure(ExitCode::kNotReachable,
                       options.url + " cannot be measured: " + reasonOf(said, "nothing came") + ".",
                       "Check the address, and that it offers a file of some MiB.");
    }
    Report report;
    report.data["url"] = options.url;
    addSpeed(report, speed);
    report.text = listing({{"url", options.url}, {"speed", rateText(speed)}});
    return report;
}

Refusal noneWorked(const std::vector<Tried> &tried) {
    if (tried.empty()) {
        return failure(ExitCode::kNotSetUp, "This appliance serves at no address.",
                       "`ovradr conn local` shows its endpoints.");
    }
    Failure last = tried.back().speed.error();
    // The other appliance was not asked.
    if (last.exit != ExitCode::kFailed) {
        return Refusal(last);
    }
    std::string all;
    for (const Tried &one : tried) {
        all += (all.empty() ? "" : ", ") + one.endpoint;
    }
    last.message.insert(
        0, "The other appliance downloads from none of the endpoints of this one, tried " + all +
               ": ");
    return Refusal(last);
}

Outcome reportOf(const std::string &nodeId, const std::string &speed,
                 const std::vector<Tried> &tried) {
    Report report;
    report.data["node_id"] = nodeId;
    addSpeed(report, speed);
    std::vector<std::vector<std::string>> rows;
    for (const Tried &one : tried) {
        Json::Value item;
        item["endpoint"] = one.endpoint;
        item["success"] = one.speed.has_value();
        if (one.speed) {
            item["speed"] = *one.speed;
        } else {
            item["code"] = one.speed.error().code;
            item["message"] = one.speed.error().message;
        }
        report.data["endpoints"].append(item);
        rows.push_back(
            {one.endpoint, one.speed ? rateText(*one.speed) : one.speed.error().message});
    }
    report.text = table({"ENDPOINT OF THIS APPLIANCE", "OUTCOME"}, rows) + "\n" +
                  listing({{"node", nodeId}, {"downloads at", rateText(speed)}});
    return report;
}

Outcome measureNode(const SpeedOptions &options) {
    const Expected<std::string> nodeId = resolveNode(options.node);
    if (!nodeId) {
        return Refusal(nodeId.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    OvraDRNode::Node test;
    std::vector<Tried> tried;
    std::string speed;
    std::string said;
    {
        Progress progress;
        progress.say("making the test file");
        speed = test.TestSyncSpeed(
            *nodeId, options.retries, options.seconds,
            [&](const Conn &conn, const Response *answer, const ErrRecorder &sender) {
                if (answer == nullptr) {
                    progress.say(targetText(conn) + ": measuring");
                    return;
                }
                const std::string measured = answer->getDataFieldtoStr("speed");
                tried.push_back(
                    {targetText(conn), !answer->isSuccess()
                                           ? failureOf(OvraDRNode::errorOf(sender, *answer))
                                       : measured.empty() ? failureOf(ERR::kFailed)
                                                          : Expected<std::string>(measured)});
            });
        said = progress.caught();
    }
    if (speed.empty() && tried.empty() && test.GetErrCode() == ERR::kBadParameter) {
        return failure(ExitCode::kNotSetUp,
                       "No test file can be made: " + reasonOf(said, "the script cannot be run") +
                           ".",
                       "Run `ovradr setup` as root, on a disk with room for 128 MiB.");
    }
    return speed.empty() ? Outcome(noneWorked(tried)) : reportOf(*nodeId, speed, tried);
}

Outcome measure(const SpeedOptions &options) {
    if (options.node.empty() == options.url.empty()) {
        return failure(ExitCode::kUsage, "Either a node or --url has to be given.",
                       "`ovradr speed --help` shows examples.");
    }
    if (!options.url.empty()) {
        return measureUrl(options);
    }
    if (options.seconds > kMaxSeconds) {
        return failure(ExitCode::kUsage, "A node gets 45 seconds at most.",
                       "Give a smaller --timeout.");
    }
    return measureNode(options);
}

} // namespace

void addSpeedCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("speed", "Measure how fast data moves to a node, or from a URL.");
    const auto options = std::make_shared<SpeedOptions>();
    command->add_option(
        "NODE", options->node,
        "The node that downloads from this one: its name, its id, or the beginning of it");
    command->add_option("--url", options->url, "Download from this URL to here instead");
    command->add_option("--retries", options->retries, "Further attempts at each endpoint (1)")
        ->check(wholeNumber(0, kMaxRetries));
    command
        ->add_option("--timeout", options->seconds,
                     "Seconds for each endpoint (15), at most 45; 600 with --url")
        ->check(wholeNumber(1, kMaxUrlSeconds));
    command->footer(
        "The endpoints of this appliance are tried one after the other until one works.\n"
        "Examples:\n"
        "  ovradr speed 3f2a\n"
        "  ovradr speed --url https://nas2.example/some/file");
    command->callback([&chosen, options] { chosen = [options] { return measure(*options); }; });
}

} // namespace Ovradr
