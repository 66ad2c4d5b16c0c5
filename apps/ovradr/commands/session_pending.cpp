// SPDX-License-Identifier: Apache-2.0
#include "commands/session_commands.h"
#include "cred_report.h"
#include "endpoint.h"
#include "node_ref.h"
#include "output.h"
#include "target.h"

#include <ovradrnode/sender.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <set>
#include <vector>

namespace Ovradr {

namespace {

using OvraApps::PendingRelease;
using OvraApps::PendingReleases;

struct PendingOptions {
    bool retry = false;
    std::string forget;
};

Json::Value toJson(const PendingRelease &release) {
    Json::Value json;
    json["reference"] = release.reference();
    json["node_id"] = release.nodeId;
    json["cred_id"] = release.credId;
    json["endpoint"] = targetText(release.conn);
    json["noted"] = Json::Int64(release.noted);
    json["attempts"] = release.attempts;
    json["next_try"] = Json::Int64(release.nextTry);
    json["code"] = release.code;
    return json;
}

std::vector<std::string> toRow(const PendingRelease &release, const std::string &name) {
    // Noted by a command that is still in progress, or was killed.
    const bool fresh = release.attempts == 0;
    return {name,
            shortId(release.reference()),
            shortId(release.nodeId),
            targetText(release.conn),
            whenText(release.noted),
            std::to_string(release.attempts),
            whenText(release.nextTry),
            fresh ? "not tried yet" : failureOf(release.code).value().message};
}

Report reportOf(const std::vector<PendingRelease> &releases) {
    Report report;
    report.data["pending"] = Json::Value(Json::arrayValue);
    std::set<std::string> nodes;
    std::transform(releases.begin(), releases.end(), std::inserter(nodes, nodes.end()),
                   [](const PendingRelease &release) { return release.nodeId; });
    const OvraApps::NodeNames names(nodes);
    std::vector<std::vector<std::string>> rows;
    for (const PendingRelease &release : releases) {
        const std::string &name = names.of(release.nodeId).shown();
        Json::Value json = toJson(release);
        json["name"] = name;
        report.data["pending"].append(std::move(json));
        rows.push_back(toRow(release, name));
    }
    report.text =
        rows.empty()
            ? "No session waits to be released on another node.\n"
            : table({"NAME", "SESSION", "NODE", "ENDPOINT", "SINCE", "TRIES", "NEXT TRY", "WHY"},
                    rows);
    return report;
}

Outcome forget(PendingReleases &store, const std::vector<PendingRelease> &releases,
               const std::string &text) {
    std::set<std::string> references;
    std::transform(releases.begin(), releases.end(), std::inserter(references, references.end()),
                   [](const PendingRelease &release) { return release.reference(); });
    const Expected<std::string> reference =
        chooseId(references, text, "pending session", "`ovradr session pending` shows all.");
    if (!reference) {
        return Refusal(reference.error());
    }
    if (!store.forget(*reference)) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    Report report;
    report.data["forgotten"] = *reference;
    report.text = "Forgotten; nobody tries to release " + *reference + " any more.\n";
    return report;
}

/// Tries each once, even if not due and whatever was found about its endpoint before, and reports
/// the result: the first failure, if a session is left behind.
Outcome retry(PendingReleases &store, const std::vector<PendingRelease> &releases) {
    Report report;
    report.data["tried"] = Json::Value(Json::arrayValue);
    std::optional<Failure> left;
    for (const PendingRelease &release : releases) {
        (void)directEndpoint(release.conn).map(OvraDRNode::BaseSender::IsConnectable);
        const OvraApps::Release result = OvraApps::retryRelease(release, store);
        Json::Value json = toJson(release);
        addRelease(json, result);
        report.data["tried"].append(json);
        report.text += release.reference() + " at " + printable(targetText(release.conn)) + ": " +
                       printable(releaseText(result, false)) + "\n";
        if (!left && result.state == OvraApps::Release::State::kLeft) {
            left = failureOf(result.code, result.detail).value();
            if (result.code == OvraDRCore::ERR::kNotConnectable) {
                addReason(*left, release.conn);
            }
        }
    }
    if (left) {
        left->data = report.data;
        left->text = report.text;
        return Refusal(*left);
    }
    if (releases.empty()) {
        report.text = reportOf(releases).text;
    }
    return report;
}

Outcome pending(const PendingOptions &options) {
    PendingReleases store;
    std::vector<PendingRelease> releases;
    if (!store.isOpen() || !store.list(releases)) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    if (!options.forget.empty()) {
        return forget(store, releases, options.forget);
    }
    return options.retry ? retry(store, releases) : Outcome(reportOf(releases));
}

} // namespace

void addSessionPendingCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "pending", "The sessions on other nodes that could not be released yet.");
    const auto options = std::make_shared<PendingOptions>();
    CLI::Option *now = command->add_flag("--retry", options->retry, "Try all of them now");
    command
        ->add_option("--forget", options->forget,
                     "Give this SESSION up, e.g. because its node is gone for good")
        ->excludes(now);
    command->footer("ovradrd tries them again by itself, with growing pauses.\n"
                    "Example:\n  ovradr session pending --retry");
    command->callback([&chosen, options] { chosen = [options] { return pending(*options); }; });
}

} // namespace Ovradr
