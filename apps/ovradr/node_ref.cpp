// SPDX-License-Identifier: Apache-2.0
#include "node_ref.h"

#include "access.h"
#include "closest.h"
#include "granted_session.h"
#include "node_view.h"
#include "output.h"
#include "provision/node_database.h"

#include <ovradrnode/node_db.h>
#include <ovraplatform/appliance.h>

#include <unistd.h>

#include <algorithm>
#include <map>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

constexpr const char *kLocalWord = "local";
constexpr DRNodeDB::CredType kBothTables = DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP;
constexpr const char *kListHint = "`ovradr node list` shows the nodes that there are.";

Refusal notFound(const std::string &text, const std::string &what,
                 const std::vector<std::string> &known, const std::string &hint) {
    const std::string meant = closest(text, known);
    return failure(ExitCode::kNotFound, "There is no " + what + " \"" + text + "\".",
                   (meant.empty() ? "" : "Did you mean \"" + meant + "\"? ") + hint);
}

/// The error for a text that means each of the `found`.
Refusal notOne(const std::string &text, const std::string &what,
               const std::vector<std::string> &found, const OvraApps::NodeNames &names) {
    constexpr std::size_t kShown = 4;
    std::string list;
    for (std::size_t i = 0; i < std::min(found.size(), kShown); ++i) {
        const std::string &name = names.of(found[i]).shown();
        list += (i == 0 ? "" : ", ") + found[i] + (name.empty() ? "" : " (" + name + ")");
    }
    return failure(ExitCode::kUsage,
                   "\"" + text + "\" means more than one " + what + ": " + list +
                       (found.size() > kShown ? " and more." : "."),
                   "Write the id; `ovradr node name ID NAME` gives a node a name of its own.");
}

} // namespace

Expected<std::string> chooseId(const std::set<std::string> &ids, const std::string &text,
                               const std::string &what, const std::string &hint) {
    if (ids.count(text) != 0) {
        return text;
    }
    std::vector<std::string> found;
    std::copy_if(ids.begin(), ids.end(), std::back_inserter(found),
                 [&text](const std::string &id) { return !text.empty() && id.starts_with(text); });
    if (found.size() == 1) {
        return found.front();
    }
    if (found.empty()) {
        return notFound(text, what, {ids.begin(), ids.end()}, hint);
    }
    return failure(ExitCode::kUsage,
                   "\"" + text + "\" is the beginning of more than one " + what + ": " + found[0] +
                       " and " + found[1] + ".",
                   "Write more of it.");
}

Expected<std::string> chooseNode(const std::set<std::string> &ids, const std::string &text,
                                 const std::string &what, const std::string &hint) {
    if (ids.count(text) != 0) {
        return text;
    }
    const OvraApps::NodeNames names(ids);
    std::vector<std::string> found;
    std::vector<std::string> known;
    for (const std::string &id : ids) {
        const OvraApps::NodeName &name = names.of(id);
        if (!text.empty() && (id.starts_with(text) || name.matches(text))) {
            found.push_back(id);
        }
        known.insert(known.end(), {id, name.given, name.host});
    }
    if (found.size() == 1) {
        return found.front();
    }
    return found.empty() ? notFound(text, what, known, hint) : notOne(text, what, found, names);
}

Expected<std::string> localNode() {
    if (const auto allowed = checkUser(); !allowed) {
        return Refusal(allowed.error());
    }
    const std::string id = DRNode::getLocalNodeId();
    if (id.empty()) {
        return failure(ExitCode::kNotSetUp,
                       "The node id of this appliance cannot be used, and none can be made.",
                       "Run the command as root, and `ovradr setup` before it if that was never "
                       "done.");
    }
    return id;
}

Expected<std::set<std::string>> listNodes() {
    const Expected<std::string> local = localNode();
    if (!local) {
        return Refusal(local.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    std::vector<DRNode> nodes;
    DRNodeDB::List(nodes, kBothTables);
    std::set<std::string> ids{*local};
    std::transform(nodes.begin(), nodes.end(), std::inserter(ids, ids.end()),
                   [](const DRNode &node) { return node.nodeId; });
    return ids;
}

Expected<std::vector<DRNode>> allCredentials() {
    std::vector<OvraDRCore::SqliteValueList> rows;
    for (const OvraDRCore::SqliteTableHandler &table :
         {OvraDRCore::SqliteTableHandler(OvraDRNode::NodeCredSqliteTable()),
          OvraDRCore::SqliteTableHandler(OvraDRNode::TempCredSqliteTable())}) {
        OvraDRCore::SelectCommand command;
        command.SelectAll();
        command.SetTable(table);
        if (!OvraDRNode::NodeDBHandler::GetHandler().SelectRecords(command, rows)) {
            return failure(ExitCode::kNotSetUp, "The credentials of this node cannot be read.",
                           "The system log says why; correct that and try again.");
        }
    }
    std::vector<DRNode> records(rows.size());
    for (std::size_t i = 0; i < rows.size(); ++i) {
        (void)records[i].FromSqliteValues(rows[i]); // an incomplete row counts too
    }
    return records;
}

Expected<std::string> resolveNode(const std::string &text) {
    Expected<std::string> local = localNode();
    if (!local || text == kLocalWord || text == *local) {
        return local;
    }
    return listNodes().and_then([&text](const std::set<std::string> &ids) {
        return chooseNode(ids, text, "node", kListHint)
            .or_else([&text](const Failure &failed) -> Expected<std::string> {
                const Expected<std::string> other =
                    failed.exit == ExitCode::kNotFound ? resolveAnyNode(text) : Refusal(failed);
                if (!other) {
                    return Refusal(failed);
                }
                return failure(ExitCode::kNotFound,
                               "No credential reaches the node " + *other + ".",
                               "`ovradr cred create URL --account NAME` makes one; `ovradr session "
                               "list` shows whether it reaches this one.");
            });
    });
}

Expected<std::string> resolveAnyNode(const std::string &text) {
    Expected<std::string> local = localNode();
    if (!local || text == kLocalWord || text == *local) {
        return local;
    }
    return listNodes().and_then([&text](std::set<std::string> ids) {
        ids.merge(std::set<std::string>(OvraApps::NodeNames({}).named()));
        // A store that is not there would be made.
        const bool granted = access(OvraPlatform::kSessionsFile, R_OK) == 0;
        for (const GrantedSession &session :
             granted ? grantedSessions().value_or(std::vector<GrantedSession>())
                     : std::vector<GrantedSession>()) {
            if (!session.nodeId.empty()) {
                ids.insert(session.nodeId);
            }
        }
        return chooseNode(ids, text, "node", kListHint);
    });
}

Json::Value nodeJson(const std::string &nodeId, const OvraApps::NodeName &name) {
    Json::Value json;
    json["node_id"] = nodeId;
    json["name"] = name.shown();
    json["hostname"] = name.host;
    if (!name.comment.empty()) {
        json["comment"] = name.comment;
    }
    return json;
}

std::string nodeText(const std::string &nodeId, const OvraApps::NodeName &name) {
    return name.shown().empty() ? nodeId : name.shown() + " (" + shortId(nodeId) + ")";
}

Expected<FoundCred> resolveCred(const std::string &text) {
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    std::map<std::string, FoundCred> creds;
    std::set<std::string> ids;
    for (const bool temporary : {false, true}) {
        std::vector<DRNode> records;
        DRNodeDB::List(records, temporary ? DRNodeDB::CRED_TYPE_TEMP : DRNodeDB::CRED_TYPE_NODE);
        for (const DRNode &record : records) {
            creds.try_emplace(record.credId, FoundCred{record, temporary});
            ids.insert(record.credId);
        }
    }
    return chooseId(ids, text, "credential", "`ovradr cred list --temp` shows all that there are.")
        .map([&creds](const std::string &id) { return creds.at(id); });
}

} // namespace Ovradr
