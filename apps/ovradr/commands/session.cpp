// SPDX-License-Identifier: Apache-2.0
#include "commands/session_commands.h"
#include "granted_session.h"
#include "node_ref.h"
#include "output.h"

#include <memory>
#include <set>
#include <vector>

namespace Ovradr {

namespace {

struct SelectOptions {
    std::string reference;
    std::string node;
    std::string account;
    bool all = false;
    bool yes = false;
    bool dryRun = false;
};

constexpr const char *kListHint = "`ovradr session list` shows all.";

/// The selected node, "" for ""; possibly one that no credential reaches.
Expected<std::string> resolveGrantee(const std::vector<GrantedSession> &sessions,
                                     const std::string &text) {
    std::set<std::string> ids;
    for (const GrantedSession &session : sessions) {
        if (!session.nodeId.empty()) {
            ids.insert(session.nodeId);
        }
    }
    return text.empty() ? Expected<std::string>("")
                        : chooseNode(ids, text, "node with a session here", kListHint);
}

/// The selected session, "" for "".
Expected<std::string> resolveReference(const std::vector<GrantedSession> &sessions,
                                       const std::string &text) {
    std::set<std::string> references;
    for (const GrantedSession &session : sessions) {
        references.insert(session.reference());
    }
    return text.empty() ? Expected<std::string>("")
                        : chooseId(references, text, "session", kListHint);
}

/// Those of the sessions that the options name; without any, all.
Expected<std::vector<GrantedSession>> select(const SelectOptions &options) {
    Expected<std::vector<GrantedSession>> sessions = grantedSessions();
    if (!sessions) {
        return sessions;
    }
    const Expected<std::string> nodeId = resolveGrantee(*sessions, options.node);
    const Expected<std::string> reference = resolveReference(*sessions, options.reference);
    if (!nodeId || !reference) {
        return Refusal((nodeId ? reference : nodeId).error());
    }
    std::erase_if(*sessions, [&](const GrantedSession &session) {
        return (!nodeId->empty() && session.nodeId != *nodeId) ||
               (!options.account.empty() && session.record.user != options.account) ||
               (!reference->empty() && session.reference() != *reference);
    });
    return sessions;
}

Report reportOf(const std::vector<GrantedSession> &sessions, const char *member) {
    Report report;
    report.data[member] = Json::Value(Json::arrayValue);
    const OvraApps::NodeNames names = namesOf(sessions);
    for (const GrantedSession &session : sessions) {
        report.data[member].append(sessionJson(session, names));
    }
    return report;
}

Report list(const std::vector<GrantedSession> &sessions) {
    Report report = reportOf(sessions, "sessions");
    report.text =
        sessions.empty() ? "No sessions are granted to other nodes.\n" : sessionTable(sessions);
    return report;
}

Expected<void> confirmRevocation(const SelectOptions &options,
                                 const std::vector<GrantedSession> &sessions) {
    if (!options.reference.empty() || options.yes || sessions.empty()) {
        return {};
    }
    if (!isInteractive()) {
        return failure(ExitCode::kUsage, "There is no terminal on which this could be confirmed.",
                       "Add --yes if you mean it.");
    }
    return confirm(counted(sessions.size(), "session") +
                   " would end; nodes that use them have to pair with this one again. Go on?")
               ? Expected<void>()
               : failure(ExitCode::kFailed, "The sessions stay.", "");
}

Outcome revoke(const SelectOptions &options) {
    if (options.reference.empty() && options.node.empty() && options.account.empty() &&
        !options.all) {
        return failure(ExitCode::kUsage, "It is not said which sessions.",
                       "Name one by its SESSION, or use --node, --account or --all.");
    }
    const Expected<std::vector<GrantedSession>> sessions = select(options);
    if (!sessions) {
        return Refusal(sessions.error());
    }
    if (options.dryRun) {
        Report report = reportOf(*sessions, "would_revoke");
        report.text = sessions->empty() ? "Nothing would be revoked.\n"
                                        : "These would end:\n" + sessionTable(*sessions);
        return report;
    }
    if (const auto confirmed = confirmRevocation(options, *sessions); !confirmed) {
        return Refusal(confirmed.error());
    }
    if (const auto ended = endSessions(*sessions); !ended) {
        return Refusal(ended.error());
    }
    Report report = reportOf(*sessions, "revoked");
    report.text = "Ended: " + counted(sessions->size(), "session") + ".\n";
    return report;
}

void addFilters(CLI::App &command, SelectOptions &options) {
    command.add_option("--node", options.node,
                       "Those of this node: its name, its id, or the beginning of it");
    command.add_option("--account", options.account, "Those of this account");
}

} // namespace

void addSessionCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("session", "The sessions that nodes granted each other.");
    family->require_subcommand(1);
    const auto options = std::make_shared<SelectOptions>();

    CLI::App *listing =
        family->add_subcommand("list", "List the sessions that were granted to other nodes.");
    addFilters(*listing, *options);
    listing->footer("Example:\n  ovradr session list --node 3f2a");
    listing->callback(
        [&chosen, options] { chosen = [options] { return select(*options).map(list); }; });

    CLI::App *revoking = family->add_subcommand(
        "revoke", "End sessions: the credentials that use them stop working.");
    CLI::Option *reference =
        revoking->add_option("SESSION", options->reference, "As listed, or the beginning of it");
    addFilters(*revoking, *options);
    revoking->add_flag("--all", options->all, "All that were granted")->excludes(reference);
    revoking->add_flag("--yes", options->yes, "Do not ask");
    revoking->add_flag("--dry-run", options->dryRun, "Only list what would end");
    revoking->footer("Examples:\n"
                     "  ovradr session revoke 5d0e\n"
                     "  ovradr session revoke --node 3f2a --dry-run");
    revoking->callback([&chosen, options] { chosen = [options] { return revoke(*options); }; });

    addSessionAuditCommand(*family, chosen);
    addSessionPendingCommand(*family, chosen);
}

} // namespace Ovradr
