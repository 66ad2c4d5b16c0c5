// SPDX-License-Identifier: Apache-2.0
#include "commands/session_commands.h"
#include "granted_session.h"
#include "node_ref.h"
#include "node_view.h"
#include "output.h"
#include "renewal.h"
#include "target.h"

#include <ovradrcore/json.h>
#include <ovradrnode/sender.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <map>
#include <memory>
#include <thread>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRCore::memberString;
using OvraDRCore::Request;
using OvraDRCore::Response;
using OvraDRNode::Conn;
using OvraDRNode::NodeSender;

constexpr const char *kCredentialApi = "OVRA.DR.Node.Credential";

/// A node that is pairing has a session already and stores its credential a request later.
constexpr std::chrono::seconds kBetweenLooks{5};

struct AuditOptions {
    std::string node;
    bool revoke = false;
    bool yes = false;
};

/// A credential to this node that the other node says it holds.
struct HeldCred {
    std::string credId;
    std::string reference; ///< of its session, which this node granted
    Conn conn;
    bool temporary = false;
};

/// What each side has.
struct Audit {
    std::string nodeId;
    std::vector<GrantedSession> granted; ///< to that node
    std::vector<HeldCred> held;
    /// Every session granted by this node: its account by its reference.
    std::map<std::string, std::string> live;

    bool isOrphan(const GrantedSession &session) const {
        return std::none_of(held.begin(), held.end(), [&session](const HeldCred &cred) {
            return cred.reference == session.reference();
        });
    }
    bool isOrphan(const HeldCred &cred) const { return live.count(cred.reference) == 0; }
};

Expected<Json::Value> ask(const std::string &nodeId, const char *method,
                          const Json::Value &params) {
    NodeSender sender(nodeId);
    const Response answer = sender.process(Request(kCredentialApi, 1, method, params));
    if (answer.isSuccess()) {
        return answer.getData();
    }
    return nodeFailure(failureOf(errorOf(sender, answer)), nodeId);
}

Expected<std::vector<HeldCred>> heldCreds(const std::string &nodeId, const std::string &localId) {
    Json::Value params(Json::objectValue);
    params["node_id"] = localId;
    const Expected<Json::Value> data = ask(nodeId, "list", params);
    if (!data) {
        return Refusal(data.error());
    }
    std::vector<HeldCred> creds;
    const Json::Value entries = data->isObject() ? (*data)["creds"] : Json::Value();
    bool complete = entries.isArray();
    for (const Json::Value &entry : complete ? entries : Json::Value(Json::arrayValue)) {
        HeldCred cred{memberString(entry, "cred_id"), memberString(entry, "session_reference"),
                      Conn(), false};
        complete = complete && !cred.credId.empty() && !cred.reference.empty();
        if (complete) {
            cred.conn = Conn::fromJson(entry);
            cred.temporary = entry["temporary"].isBool() && entry["temporary"].asBool();
            creds.push_back(cred);
        }
    }
    // Half an answer would make sessions in use look like orphans.
    return complete
               ? Expected<std::vector<HeldCred>>(creds)
               : failure(ExitCode::kFailed,
                         "The other appliance does not say which sessions its credentials use.",
                         "Check that both appliances run versions that fit together.");
}

Expected<Audit> look(const std::string &nodeId, const std::string &localId) {
    const Expected<std::vector<HeldCred>> held = heldCreds(nodeId, localId);
    if (!held) {
        return Refusal(held.error());
    }
    const Expected<std::vector<GrantedSession>> sessions = grantedSessions();
    if (!sessions) {
        return Refusal(sessions.error());
    }
    Audit audit{nodeId, {}, *held, {}};
    for (const GrantedSession &session : *sessions) {
        audit.live.emplace(session.reference(), session.record.user);
        if (session.nodeId == nodeId) {
            audit.granted.push_back(session);
        }
    }
    return audit;
}

std::vector<GrantedSession> orphanSessions(const Audit &audit) {
    std::vector<GrantedSession> orphans;
    std::copy_if(audit.granted.begin(), audit.granted.end(), std::back_inserter(orphans),
                 [&audit](const GrantedSession &session) { return audit.isOrphan(session); });
    return orphans;
}

std::vector<HeldCred> orphanCreds(const Audit &audit) {
    std::vector<HeldCred> orphans;
    std::copy_if(audit.held.begin(), audit.held.end(), std::back_inserter(orphans),
                 [&audit](const HeldCred &cred) { return audit.isOrphan(cred); });
    return orphans;
}

Json::Value toJson(const Audit &audit) {
    Json::Value json;
    json["node_id"] = audit.nodeId;
    json["sessions"] = Json::Value(Json::arrayValue);
    json["creds"] = Json::Value(Json::arrayValue);
    const OvraApps::NodeNames names = namesOf(audit.granted);
    for (const GrantedSession &session : audit.granted) {
        Json::Value entry = sessionJson(session, names);
        entry["orphan"] = audit.isOrphan(session);
        json["sessions"].append(entry);
    }
    for (const HeldCred &cred : audit.held) {
        Json::Value entry;
        entry["endpoint"] = targetText(cred.conn);
        entry["cred_id"] = cred.credId;
        entry["reference"] = cred.reference;
        entry["temporary"] = cred.temporary;
        entry["orphan"] = audit.isOrphan(cred);
        json["creds"].append(entry);
    }
    return json;
}

std::string toText(const Audit &audit) {
    std::vector<std::vector<std::string>> rows;
    for (const GrantedSession &session : audit.granted) {
        if (audit.isOrphan(session)) {
            rows.push_back({shortId(session.reference()), session.record.user, "", "",
                            "orphan: no credential over there uses it"});
        }
    }
    for (const HeldCred &cred : audit.held) {
        const auto account = audit.live.find(cred.reference);
        rows.push_back({cred.reference, account == audit.live.end() ? "" : account->second,
                        shortId(cred.credId), targetText(cred.conn),
                        audit.isOrphan(cred) ? "orphan: its session is gone here" : "in use"});
    }
    return rows.empty()
               ? "No session was granted to that node, and it holds no credential to this one.\n"
               : table({"SESSION", "ACCOUNT", "CREDENTIAL OVER THERE", "ENDPOINT", "STATE"}, rows);
}

std::string countText(std::size_t sessions, std::size_t creds) {
    return counted(sessions, "session") + " here, " + counted(creds, "credential") + " over there";
}

Expected<void> confirmRevocation(bool yes, const std::string &found, std::size_t sessions,
                                 std::size_t creds) {
    if (yes) {
        return {};
    }
    if (!isInteractive()) {
        return failure(ExitCode::kUsage, "There is no terminal on which this could be confirmed.",
                       "Add --yes if you mean it.");
    }
    std::fputs(found.c_str(), stderr);
    return confirm("Remove the orphans, " + countText(sessions, creds) + "?")
               ? Expected<void>()
               : failure(ExitCode::kFailed, "Everything stays as it is.", "");
}

/// Removes what is an orphan in both looks.
Outcome revoke(const Audit &first, const Audit &second) {
    std::vector<GrantedSession> sessions = orphanSessions(second);
    std::erase_if(sessions, [&first](const GrantedSession &session) {
        return !first.isOrphan(session) || first.live.count(session.reference()) == 0;
    });
    std::vector<HeldCred> creds = orphanCreds(second);
    std::erase_if(creds, [&first](const HeldCred &cred) { return !first.isOrphan(cred); });
    Report report;
    report.data = toJson(second);
    report.data["revoked"] = Json::Value(Json::arrayValue);
    report.data["deleted"] = Json::Value(Json::arrayValue);
    if (const auto ended = endSessions(sessions); !ended) {
        return Refusal(ended.error());
    }
    for (const GrantedSession &session : sessions) {
        report.data["revoked"].append(session.reference());
    }
    for (const HeldCred &cred : creds) {
        Json::Value params(Json::objectValue);
        params["cred_id"] = cred.credId;
        const Expected<Json::Value> done = ask(second.nodeId, "delete", params);
        if (!done) {
            return Refusal(done.error());
        }
        report.data["deleted"].append(cred.credId);
    }
    report.text = "Removed: " + countText(sessions.size(), creds.size()) + ".\n";
    return report;
}

/// The failure for a node that no credential reaches: it may hold sessions here all the same.
Refusal noWayTo(const std::string &node, const Failure &unknown) {
    const Expected<std::vector<GrantedSession>> sessions = grantedSessions();
    if (!sessions) {
        return Refusal(sessions.error());
    }
    const auto found =
        std::find_if(sessions->rbegin(), sessions->rend(), [&node](const GrantedSession &session) {
            return !node.empty() && session.nodeId.starts_with(node);
        });
    if (found == sessions->rend()) {
        return Refusal(unknown);
    }
    const std::string &client = found->record.remote;
    return failure(ExitCode::kNotFound,
                   "No credential reaches the node " + found->nodeId +
                       ", which has a session here as " + found->record.user +
                       (client.empty() ? "" : ", granted to " + client) +
                       ": nobody can ask it what it still uses.",
                   "Make a way to it with `ovradr cred create URL --account NAME`, or end what it "
                   "has with `ovradr session revoke --node " +
                       shortId(found->nodeId) + "`.");
}

Outcome audit(const AuditOptions &options) {
    const Expected<std::string> nodeId = resolveNode(options.node);
    const Expected<std::string> localId = localNode();
    if (!nodeId && nodeId.error().exit == ExitCode::kNotFound) {
        return noWayTo(options.node, nodeId.error());
    }
    if (!nodeId || !localId) {
        return Refusal((nodeId ? localId : nodeId).error());
    }
    if (*nodeId == *localId) {
        return failure(ExitCode::kUsage, "This node grants itself no sessions.",
                       "Name another node; `ovradr node list` shows them.");
    }
    const Expected<Audit> first = look(*nodeId, *localId);
    if (!first) {
        return Refusal(first.error());
    }
    const auto looked = std::chrono::steady_clock::now();
    const std::size_t sessions = orphanSessions(*first).size();
    const std::size_t creds = orphanCreds(*first).size();
    Report report;
    report.data = toJson(*first);
    report.text = toText(*first) + "Orphans: " + countText(sessions, creds) + ".\n";
    if (!options.revoke || sessions + creds == 0) {
        return report;
    }
    if (const auto confirmed = confirmRevocation(options.yes, toText(*first), sessions, creds);
        !confirmed) {
        return Refusal(confirmed.error());
    }
    std::this_thread::sleep_until(looked + kBetweenLooks);
    return look(*nodeId, *localId).and_then([&first](const Audit &second) {
        return revoke(*first, second);
    });
}

} // namespace

void addSessionAuditCommand(CLI::App &family, Command &chosen) {
    CLI::App *command = family.add_subcommand(
        "audit", "Compare the sessions granted to a node with the credentials that it holds.");
    const auto options = std::make_shared<AuditOptions>();
    command->add_option("NODE", options->node, "A name, a node id, or the beginning of one")
        ->required();
    CLI::Option *revoking =
        command->add_flag("--revoke", options->revoke,
                          "End the sessions that no credential over there uses, and have the "
                          "credentials deleted whose session is gone here");
    command->add_flag("--yes", options->yes, "Do not ask")->needs(revoking);
    command->footer("Example:\n  ovradr session audit 3f2a");
    command->callback([&chosen, options] { chosen = [options] { return audit(*options); }; });
}

} // namespace Ovradr
