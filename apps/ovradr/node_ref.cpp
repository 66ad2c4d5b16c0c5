// SPDX-License-Identifier: Apache-2.0
#include "node_ref.h"

#include "access.h"
#include "provision/node_database.h"

#include <ovradrnode/node_db.h>

#include <algorithm>
#include <map>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRNode::DRNode;
using OvraDRNode::DRNodeDB;

constexpr const char *kLocalWord = "local";
constexpr DRNodeDB::CredType kBothTables = DRNodeDB::CRED_TYPE_NODE | DRNodeDB::CRED_TYPE_TEMP;

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
        return failure(ExitCode::kNotFound, "There is no " + what + " \"" + text + "\".", hint);
    }
    return failure(ExitCode::kUsage,
                   "\"" + text + "\" is the beginning of more than one " + what + ": " + found[0] +
                       " and " + found[1] + ".",
                   "Write more of it.");
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
        return chooseId(ids, text, "node", "`ovradr node list` shows the nodes that there are.");
    });
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
