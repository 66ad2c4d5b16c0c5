// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "endpoint.h"
#include "output.h"
#include "target.h"
#include "trust.h"

#include <ovraplatform/trust_store.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;
using OvraPlatform::CredError;
using OvraPlatform::TrustStore;

Outcome local() {
    Report report;
    report.data["conns"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    for (const Conn &conn : Conn::listLocal()) {
        Json::Value json = conn.toJson();
        json["fingerprint"] = ownFingerprint(conn);
        report.data["conns"].append(json);
        rows.push_back({targetText(conn), json["fingerprint"].asString()});
    }
    report.text =
        rows.empty() ? "This appliance serves at no address.\n" : table({"ENDPOINT", "KEY"}, rows);
    return report;
}

Outcome test(const Conn &conn) {
    const Expected<Conn> direct = directEndpoint(conn);
    if (!direct) {
        return Refusal(direct.error());
    }
    const auto start = std::chrono::steady_clock::now();
    if (const auto answers = probeEndpoint(*direct); !answers) {
        return Refusal(answers.error());
    }
    const auto took = std::chrono::duration_cast<std::chrono::milliseconds>(
                          std::chrono::steady_clock::now() - start)
                          .count();
    const auto met =
        OvraPlatform::peerFingerprint(direct->protocol, direct->addr, direct->port, kKeySeconds);
    Report report;
    report.data["endpoint"] = targetText(*direct);
    report.data["connectable"] = true;
    report.data["milliseconds"] = Json::Int64(took);
    if (met) {
        report.data["fingerprint"] = met->fingerprint;
        report.data["trust"] = trustWord(*met);
    }
    report.text = listing({{"endpoint", targetText(*direct)},
                           {"connectable", "yes, in " + std::to_string(took) + " ms"},
                           {"key", met ? met->fingerprint : "none shown"},
                           {"trusted", met ? trustText(*met) : ""}});
    return report;
}

Outcome forget(const Conn &conn) {
    const std::string endpoint = targetText(conn);
    TrustStore store;
    const auto known = store.list();
    if (!known) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    if (std::none_of(known->begin(), known->end(), [&endpoint](const TrustStore::Entry &entry) {
            return entry.endpoint == endpoint;
        })) {
        return failure(ExitCode::kNotFound, "No key is known for " + endpoint + ".",
                       "There is nothing to forget.");
    }
    if (!store.forget(endpoint)) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    Report report;
    report.data["endpoint"] = endpoint;
    report.text = printable("The key of " + endpoint + " is forgotten.") + "\n";
    return report;
}

using UrlAction = Outcome (*)(const Conn &);

void addUrlCommand(CLI::App &family, const char *name, const char *description, const char *example,
                   Command &chosen, UrlAction action) {
    CLI::App *command = family.add_subcommand(name, description);
    const auto url = std::make_shared<std::string>();
    command->add_option("URL", *url, "https://HOST[:5001], http://HOST[:5000] or flk:ALIAS")
        ->required();
    command->footer(std::string("Example:\n  ") + example);
    command->callback([&chosen, url, action] {
        chosen = [url, action] { return parseTarget(*url).and_then(action); };
    });
}

} // namespace

void addConnCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("conn", "Endpoints, here and over there.");
    family->require_subcommand(1);
    CLI::App *localCommand =
        family->add_subcommand("local", "List where this appliance serves, and with which keys.");
    localCommand->footer("Example:\n  ovradr conn local");
    localCommand->callback([&chosen] { chosen = local; });
    addUrlCommand(*family, "test", "Test whether an endpoint answers, and with which key.",
                  "ovradr conn test https://nas2", chosen, test);
    addUrlCommand(*family, "forget", "Forget the known key of an endpoint, when it was changed.",
                  "ovradr conn forget https://nas2", chosen, forget);
}

} // namespace Ovradr
