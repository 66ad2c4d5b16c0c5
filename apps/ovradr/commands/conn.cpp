// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "endpoint.h"
#include "output.h"
#include "progress.h"
#include "prompt.h"
#include "remote_login.h"
#include "target.h"
#include "trust.h"

#include <ovraplatform/trust_store.h>

#include <chrono>
#include <cstdio>
#include <memory>
#include <optional>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::Conn;
using OvraPlatform::CredError;
using OvraPlatform::TrustStore;

std::string trustKey(const Conn &conn) {
    return OvraPlatform::trustKey(conn.protocol, conn.addr, conn.port);
}

Outcome local() {
    Report report;
    report.data["conns"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    for (const Conn &conn : Conn::listLocal()) {
        Json::Value json;
        json["endpoint"] = targetText(conn);
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
    // An endpoint that says nothing takes a while.
    Progress progress;
    progress.say("asking " + targetText(conn));
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
    report.data["endpoint"] = targetText(conn);
    report.data["connectable"] = true;
    report.data["milliseconds"] = Json::Int64(took);
    if (met) {
        report.data["fingerprint"] = met->fingerprint;
        report.data["trust"] = trustWord(*met);
    }
    report.text = listing({{"endpoint", targetText(conn)},
                           {"connectable", "yes, in " + std::to_string(took) + " ms"},
                           {"key", met ? met->fingerprint : "none shown"},
                           {"trusted", !met          ? ""
                                       : checkUser() ? trustText(*met)
                                                     : "only root can tell"}});
    return report;
}

/// The endpoint's line in the file of trusted keys, for people.
std::string knownText(const std::optional<TrustStore::Entry> &known) {
    if (!known) {
        return "nothing";
    }
    return known->value == TrustStore::kSystem ? "the certificates that this system trusts"
                                               : known->value;
}

Outcome forget(const Conn &conn) {
    if (const auto allowed = checkUser(); !allowed) {
        return Refusal(allowed.error());
    }
    const std::string endpoint = trustKey(conn);
    TrustStore store;
    if (!store.list()) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    const auto known = store.find(endpoint);
    if (!known || known->value == TrustStore::kForgotten) {
        return failure(ExitCode::kNotFound, "No key is known for " + targetText(conn) + ".",
                       "There is nothing to forget.");
    }
    if (!store.forget(endpoint)) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    Report report;
    report.data["endpoint"] = targetText(conn);
    report.text =
        printable("The key of " + targetText(conn) +
                  " is forgotten: nothing is sent there until you run `ovradr conn trust " +
                  targetText(conn) + "`.") +
        "\n";
    return report;
}

/// What trust() asks the person at the terminal; success if the key may be trusted.
Expected<void> consent(const Conn &conn, const OvraPlatform::PeerIdentity &identity,
                       const std::optional<TrustStore::Entry> &known) {
    if (!isInteractive()) {
        return nobodyToAsk(conn, identity);
    }
    std::fprintf(stderr, "Trusted for %s so far: %s\n", printable(targetText(conn)).c_str(),
                 printable(knownText(known)).c_str());
    return askWhetherToTrust(conn, identity) ? Expected<void>() : notTrusted(conn, identity);
}

/// Trusts a key, also in place of another one.
/// \param expected  the key, or "" to ask about the one that the endpoint shows
Outcome trust(const Conn &conn, const std::string &expected) {
    const auto met =
        OvraPlatform::peerFingerprint(conn.protocol, conn.addr, conn.port, kKeySeconds);
    if (!met && expected.empty()) {
        return endpointFailure(conn, met.error());
    }
    if (met && !expected.empty() && met->fingerprint != expected) {
        return notNamed(conn, *met);
    }
    const auto known = TrustStore().find(trustKey(conn));
    if (expected.empty()) {
        if (const auto agreed = consent(conn, *met, known); !agreed) {
            return Refusal(agreed.error());
        }
    }
    const std::string value = met ? met->fingerprint : expected;
    if (OvraPlatform::trustEndpoint(conn.protocol, conn.addr, conn.port, value, true) !=
        OvraPlatform::TrustVerdict::kTrusted) {
        return endpointFailure(conn, CredError::kTrustUnavailable);
    }
    endLossOfKeys();
    Report report;
    report.data["endpoint"] = targetText(conn);
    report.data["trusted"] = value;
    report.data["before"] = known ? known->value : "";
    report.data["met"] = met.has_value();
    report.text = listing({{"endpoint", targetText(conn)},
                           {"trusted", knownText(TrustStore::Entry{"", value})},
                           {"before", knownText(known)},
                           {"note", met ? "" : "it did not answer, so its key was not seen"}});
    return report;
}

void addUrl(CLI::App &command, std::string &url) {
    command.add_option("URL", url, "https://HOST[:5001], http://HOST[:5000] or flk:ALIAS")
        ->required();
}

using UrlAction = Outcome (*)(const Conn &);

void addUrlCommand(CLI::App &family, const char *name, const char *description, const char *example,
                   Command &chosen, UrlAction action) {
    CLI::App *command = family.add_subcommand(name, description);
    const auto url = std::make_shared<std::string>();
    addUrl(*command, *url);
    command->footer(std::string("Example:\n  ") + example);
    command->callback([&chosen, url, action] {
        chosen = [url, action] { return parseTarget(*url).and_then(action); };
    });
}

void addTrustCommand(CLI::App &family, Command &chosen) {
    struct Options {
        std::string url;
        std::string fingerprint;
    };
    const auto options = std::make_shared<Options>();
    CLI::App *command =
        family.add_subcommand("trust", "Trust the key of an endpoint, also in place of another.");
    addUrl(*command, options->url);
    addFingerprintOption(*command, options->fingerprint)
        ->description("The key, instead of a question");
    command->footer("Examples:\n"
                    "  ovradr conn trust https://nas2\n"
                    "  ovradr conn trust flk:nas3 --fingerprint SHA256:...");
    command->callback([&chosen, options] {
        chosen = forOwnUser([options] {
            return parseTarget(options->url).and_then([&options](const Conn &conn) {
                return trust(conn, options->fingerprint);
            });
        });
    });
}

} // namespace

void addConnCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("conn", "Endpoints, here and over there.");
    family->require_subcommand(1);
    CLI::App *localCommand =
        family->add_subcommand("local", "List where this appliance serves, and with which keys.");
    localCommand->footer("Example:\n  ovradr conn local");
    localCommand->callback([&chosen] { chosen = forOwnUser(local); });
    addUrlCommand(*family, "test", "Test whether an endpoint answers, and with which key.",
                  "ovradr conn test https://nas2", chosen, test);
    addTrustCommand(*family, chosen);
    addUrlCommand(*family, "forget",
                  "Withdraw the trust in an endpoint: nothing is sent there until you trust again.",
                  "ovradr conn forget https://nas2", chosen, forget);
}

} // namespace Ovradr
