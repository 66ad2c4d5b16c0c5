// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "endpoint.h"
#include "invite_code.h"
#include "output.h"
#include "pairing.h"
#include "qr.h"
#include "shared/invites.h"
#include "target.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>

#include <unistd.h>

#include <algorithm>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraApps::Invite;
using OvraApps::Invites;
using OvraDRNode::Conn;

/// More make the code long; others can be named with --endpoint.
constexpr std::size_t kUsualEndpoints = 4;
constexpr int kUsualMinutes = 15;
constexpr int kMaxMinutes = 24 * 60;

struct InviteOptions {
    std::string account;
    int minutes = kUsualMinutes;
    std::vector<std::string> endpoints;
    bool list = false;
    std::string revoke;
};

Json::Value inviteJson(const Invite &invite) {
    Json::Value json;
    json["invite"] = invite.reference;
    json["account"] = invite.account;
    json["created"] = Json::Int64(invite.created);
    json["expires"] = Json::Int64(invite.expires);
    json["state"] = stateWord(invite.state);
    const bool hasEnded = invite.ended != 0;
    json["ended"] = hasEnded ? Json::Value(Json::Int64(invite.ended)) : Json::Value();
    if (invite.state == Invite::State::kUsed) {
        json["node_id"] = invite.node;
        json["client"] = invite.address;
    }
    return json;
}

Expected<void> checkOpen(const Invites &store) {
    return store.isOpen() ? Expected<void>() : storeFailure(ExitCode::kNotSetUp, store.error());
}

Expected<std::vector<Invite>> readInvites(Invites &store) {
    std::vector<Invite> invites;
    return checkOpen(store).and_then([&]() -> Expected<std::vector<Invite>> {
        return store.list(invites) ? Expected<std::vector<Invite>>(invites)
                                   : storeFailure(ExitCode::kNotSetUp, store.error());
    });
}

Outcome list() {
    Invites store;
    return readInvites(store).map([](const std::vector<Invite> &invites) {
        Report report;
        report.data["invites"] = Json::Value(Json::arrayValue);
        std::vector<std::vector<std::string>> rows;
        for (const Invite &invite : invites) {
            report.data["invites"].append(inviteJson(invite));
            const bool used = invite.state == Invite::State::kUsed;
            rows.push_back({invite.reference, invite.account, stateWord(invite.state),
                            timeText(invite.ended != 0 ? invite.ended : invite.expires),
                            used ? invite.node : "", used ? invite.address : ""});
        }
        report.text =
            rows.empty()
                ? "There are no invitations; `ovradr invite` makes one.\n"
                : table({"INVITATION", "ACCOUNT", "STATE", "ENDS OR ENDED", "USED BY NODE", "FROM"},
                        rows);
        return report;
    });
}

Outcome revoke(const std::string &reference) {
    Invites store;
    const Expected<std::vector<Invite>> invites = readInvites(store);
    if (!invites) {
        return Refusal(invites.error());
    }
    const auto named = std::find_if(invites->begin(), invites->end(), [&](const Invite &invite) {
        return invite.reference == reference;
    });
    if (named == invites->end()) {
        return failure(ExitCode::kNotFound, "There is no invitation \"" + reference + "\".",
                       "`ovradr invite --list` shows all.");
    }
    if (named->state == Invite::State::kUsed) {
        return failure(
            ExitCode::kFailed, "The invitation was used by node " + named->node + " already.",
            "`ovradr session revoke --node " + named->node + "` ends what that node may do here.");
    }
    const bool done = named->state == Invite::State::kOpen && store.revoke(reference);
    if (!done && !store.error().empty()) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    if (!done && named->state == Invite::State::kOpen) {
        return failure(ExitCode::kFailed, "The invitation was used in this moment.",
                       "`ovradr invite --list` says by whom.");
    }
    Report report;
    report.data["invite"] = reference;
    report.data["state"] = done ? "revoked" : stateWord(named->state);
    report.text = done ? "The invitation is revoked; its code opens nothing any more.\n"
                       : "The invitation has ended already; its code opens nothing.\n";
    return report;
}

/// Where the code says that this appliance is reached: over https or through the relay, whose key
/// is the same; IPv4 first, because it is short.
Expected<std::vector<Conn>> reachedAt(const std::vector<std::string> &named) {
    return offeredConns(named).and_then(
        [&named](std::vector<Conn> conns) -> Expected<std::vector<Conn>> {
            const auto isLeftOut = [](const Conn &conn) {
                return (!conn.isFarlink() && conn.protocol != "https") ||
                       OvraBase::isIpv6LinkLocal(conn.addr);
            };
            const std::size_t given = conns.size();
            conns.erase(std::remove_if(conns.begin(), conns.end(), isLeftOut), conns.end());
            std::stable_partition(conns.begin(), conns.end(), [](const Conn &conn) {
                return conn.addr.find(':') == std::string::npos;
            });
            if (conns.empty() || (!named.empty() && conns.size() != given)) {
                return failure(ExitCode::kUsage,
                               "A code names endpoints over https or the relay only.",
                               "Give https://HOST[:PORT] or flk:ALIAS with --endpoint.");
            }
            if (named.empty()) {
                conns.resize(std::min(conns.size(), kUsualEndpoints));
            } else if (conns.size() > InviteCode::kMaxEndpoints) {
                return failure(ExitCode::kUsage,
                               "A code names " + std::to_string(InviteCode::kMaxEndpoints) +
                                   " endpoints at most.",
                               "Name those that the other appliance reaches.");
            }
            return conns;
        });
}

std::string inviteText(const Invite &invite, const std::string &code,
                       const std::vector<std::string> &endpoints, int minutes) {
    std::string where;
    for (const std::string &endpoint : endpoints) {
        where += (where.empty() ? "" : ", ") + endpoint;
    }
    const std::string qr = isatty(STDOUT_FILENO) == 1 ? qrForTerminal(code) : "";
    return listing({{"invitation", invite.reference},
                    {"account", invite.account},
                    {"reached at", where},
                    {"ends", timeText(invite.expires) + ", in " + std::to_string(minutes) +
                                 (minutes == 1 ? " minute" : " minutes") + ", or once used"}}) +
           "\nOn the other appliance run:\n\n  ovradr pair " + code + "\n\n" + qr +
           (qr.empty() ? "" : "\n") +
           "Who has the code may pair, once: show it to nobody else. `ovradr invite --revoke " +
           invite.reference + "`\nwithdraws it.\n";
}

Outcome make(const InviteOptions &options) {
    const Expected<std::vector<Conn>> conns = reachedAt(options.endpoints);
    if (!conns) {
        return Refusal(conns.error());
    }
    const std::string fingerprint = ownFingerprint(Conn::https("localhost", kDefaultHttpsPort));
    if (fingerprint.empty()) {
        return failure(ExitCode::kNotSetUp, "The certificate of this appliance cannot be read.",
                       "Run `ovradr setup`.");
    }
    const Expected<std::string> account = localAccount(options.account);
    if (!account) {
        return Refusal(account.error());
    }
    Invites store;
    if (const auto open = checkOpen(store); !open) {
        return Refusal(open.error());
    }
    const auto made = store.make(*account, std::int64_t{options.minutes} * 60);
    if (!made) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    InviteCode code;
    code.endpoints = *conns;
    code.key = keyOf(fingerprint);
    code.reference = made->invite.reference;
    code.secret = made->secret;
    code.expires = made->invite.expires;

    Report report;
    report.data = inviteJson(made->invite);
    report.data["code"] = writeInviteCode(code);
    report.data["fingerprint"] = fingerprint;
    std::vector<std::string> endpoints;
    for (const Conn &conn : *conns) {
        endpoints.push_back(targetText(conn));
        report.data["endpoints"].append(endpoints.back());
    }
    report.text =
        inviteText(made->invite, report.data["code"].asString(), endpoints, options.minutes);
    return report;
}

Outcome invite(const InviteOptions &options) {
    if (options.list) {
        return list();
    }
    return options.revoke.empty() ? make(options) : revoke(options.revoke);
}

} // namespace

void addInviteCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("invite", "Make a code with which another appliance pairs, once.");
    const auto options = std::make_shared<InviteOptions>();
    CLI::Option *account = command->add_option(
        "--account", options->account,
        "Account of this appliance with whose rights the other one comes (pairing, which is made)");
    CLI::Option *minutes =
        command->add_option("--minutes", options->minutes, "How long the code is good for (15)");
    minutes->check([](const std::string &text) {
        return OvraBase::parseNumber<int>(text, 1, kMaxMinutes)
                   ? std::string()
                   : "it is good for 1 to " + std::to_string(kMaxMinutes) + " minutes";
    });
    CLI::Option *endpoint =
        command
            ->add_option("--endpoint", options->endpoints,
                         "This appliance is reached here; may be repeated; without it at its own "
                         "addresses")
            ->allow_extra_args(false);
    CLI::Option *listing =
        command->add_flag("--list", options->list, "List the invitations of the last week");
    CLI::Option *revoking =
        command->add_option("--revoke", options->revoke, "Withdraw this invitation");
    for (CLI::Option *making : {account, minutes, endpoint}) {
        listing->excludes(making);
        revoking->excludes(making);
    }
    listing->excludes(revoking);
    command->footer("Examples:\n"
                    "  ovradr invite\n"
                    "  ovradr invite --minutes 60 --endpoint https://nas1.example.com\n"
                    "  ovradr invite --list");
    command->callback(
        [&chosen, options] { chosen = forOwnUser([options] { return invite(*options); }); });
}

} // namespace Ovradr
